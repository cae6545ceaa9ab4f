#include "DomAttributeOrder.h"

#include <QDomDocument>
#include <QHash>
#include <QTextStream>
#include <QXmlStreamReader>

#include <algorithm>
#include <numeric>

namespace {

using Rule = DomAttributeOrder::Rule;

// What QDomNode::save did with the attributes of one element.
struct Finding
{
    Rule documentOrder;
    Rule itemOrder;
};

// Lets QDomNode::save write an element parsed with attributes of these names, in this order.
Finding probe(const QStringList& names)
{
    QString text = QStringLiteral("<P");
    for (const QString& name : names)
        text += QLatin1Char(' ') + name + QStringLiteral("=\"\"");
    text += QStringLiteral("/>");
    QDomDocument document;
    if (!document.setContent(text))
        return {Rule::Unknown, Rule::Unknown};
    const QDomElement element = document.documentElement();

    QStringList items;
    const QDomNamedNodeMap attributes = element.attributes();
    for (int i = 0; i < attributes.count(); ++i)
        items.append(attributes.item(i).nodeName());

    QString xml;
    QTextStream stream(&xml);
    element.save(stream, 0);
    stream.flush();
    QXmlStreamReader reader(xml);
    QStringList saved;
    if (reader.readNextStartElement()) {
        for (const QXmlStreamAttribute& attribute : reader.attributes())
            saved.append(attribute.qualifiedName().toString());
    }
    return {DomAttributeOrder::ruleFor(names, saved, true),
            DomAttributeOrder::ruleFor(items, saved, false)};
}

// Two elements, so that a hash order that happens to match another rule for one of them is not
// taken for that rule: a rule holds only when both elements agree on it.
Finding runningFinding()
{
    static const Finding finding = [] {
        const Finding first =
            probe({QStringLiteral("p7"), QStringLiteral("p3"), QStringLiteral("p0"),
                   QStringLiteral("p5"), QStringLiteral("p1"), QStringLiteral("p6"),
                   QStringLiteral("p2"), QStringLiteral("p4")});
        const Finding second =
            probe({QStringLiteral("State"), QStringLiteral("ID"), QStringLiteral("_k"),
                   QStringLiteral("a.b"), QStringLiteral("Zone"), QStringLiteral("m-1"),
                   QStringLiteral("B"), QStringLiteral("kind")});
        const auto agreed = [](Rule a, Rule b) { return a == b ? a : Rule::Unknown; };
        return Finding{agreed(first.documentOrder, second.documentOrder),
                       agreed(first.itemOrder, second.itemOrder)};
    }();
    return finding;
}

} // namespace

DomAttributeOrder::Rule DomAttributeOrder::forDocumentOrder()
{
    return runningFinding().documentOrder;
}

DomAttributeOrder::Rule DomAttributeOrder::forItemOrder()
{
    return runningFinding().itemOrder;
}

DomAttributeOrder::Positions DomAttributeOrder::arrange(Rule rule, const Names& names)
{
    Positions positions(names.size());
    std::iota(positions.begin(), positions.end(), qsizetype(0));
    if (names.size() < 2)
        return positions;
    switch (rule) {
    case Rule::ByName:
        std::sort(positions.begin(), positions.end(),
                  [&](qsizetype a, qsizetype b) { return names[a] < names[b]; });
        break;
    case Rule::Given:
        break;
    case Rule::Hash: {
        // Filled one by one like the DOM's own hash, without reserving, so that it grows alike.
        // Keyed by views: qHash of a view equals that of the string, so the order is the same.
        QHash<QStringView, qsizetype> hash;
        for (qsizetype i = 0; i < names.size(); ++i)
            hash.insert(names[i], i);
        positions.clear();
        for (auto it = hash.cbegin(); it != hash.cend(); ++it)
            positions.append(it.value());
        break;
    }
    case Rule::Unknown:
        positions.clear();
        break;
    }
    return positions;
}

DomAttributeOrder::Rule DomAttributeOrder::ruleFor(const QStringList& given,
                                                   const QStringList& saved, bool hashAllowed)
{
    Names names;
    for (const QString& name : given)
        names.append(name);
    const auto savedAs = [&](Rule rule) {
        const Positions positions = arrange(rule, names);
        if (positions.size() != saved.size())
            return false;
        for (qsizetype i = 0; i < positions.size(); ++i) {
            if (given[positions[i]] != saved[i])
                return false;
        }
        return true;
    };
    for (const Rule rule : {Rule::ByName, Rule::Given, Rule::Hash}) {
        if ((rule != Rule::Hash || hashAllowed) && savedAs(rule))
            return rule;
    }
    return Rule::Unknown;
}
