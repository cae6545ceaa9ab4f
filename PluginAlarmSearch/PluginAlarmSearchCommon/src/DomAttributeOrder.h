#pragma once

#include <QStringList>
#include <QStringView>
#include <QVarLengthArray>

// The order in which the running Qt's QDomNode::save writes an element's attributes. Qt 6.4
// writes them in the order of the element's attribute hash, which follows the process's hash
// seed; later versions sort them by name. A plug-in built against one Qt runs in hosts with
// another, so the order is not taken from the headers: at first use, QDomNode::save writes two
// small parsed elements and the order it chose is matched against the rules a writer without a
// DOM can follow.
class DomAttributeOrder
{
public:
    enum class Rule {
        ByName,  // sorted by name, compared in UTF-16 code units
        Given,   // in the order given
        Hash,    // that of a QHash<QString, ...> filled in the order given
        Unknown, // none of these: the caller leaves elements with several attributes to the DOM
    };

    using Names = QVarLengthArray<QStringView, 32>;
    using Positions = QVarLengthArray<qsizetype, 32>;

    // The running Qt's rule for attributes given in document order, and for attributes given in
    // the order QDomNamedNodeMap::item lists them (never Hash). Each is found once.
    static Rule forDocumentOrder();
    static Rule forItemOrder();

    // The positions in names in the order rule writes them; all of them in the order given when
    // there are fewer than two, and none under Unknown otherwise.
    static Positions arrange(Rule rule, const Names& names);

    // The rule that turns given into saved, tried in the order ByName, Given, Hash (this one only
    // when hashAllowed); Unknown when none does.
    static Rule ruleFor(const QStringList& given, const QStringList& saved, bool hashAllowed);
};
