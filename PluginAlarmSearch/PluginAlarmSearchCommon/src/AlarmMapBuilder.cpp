#include "AlarmMapBuilder.h"

#include <QVarLengthArray>

#include <algorithm>
#include <iterator>
#include <map>

namespace {

const QString TextKey = QStringLiteral("#text");
const QString EmptyText = QStringLiteral("");
constexpr int Unranked = -1;

} // namespace

QVariant AlarmMapBuilder::render(const AlarmSubtree& subtree, qsizetype index)
{
    if (m_keys.empty()) {
        m_keys.push_back(TextKey);
        m_keyRanks.push_back(0);
        m_rankedKeys.push_back(0);
    }
    // New keys are ranked once they are as many as half the ranked ones: ranking takes time in
    // proportion to all keys, so each key pays a constant share of it, however many distinct
    // names a reply brings.
    if (!m_unrankedKeys.empty() && 2 * m_unrankedKeys.size() >= m_rankedKeys.size())
        rankNewKeys();
    return renderNode(subtree, index);
}

QVariant AlarmMapBuilder::renderNode(const AlarmSubtree& subtree, qsizetype index)
{
    const SubtreeNode& node = subtree.node(index);
    bool hasChildElements = false;
    forEachChild(subtree, index, [&](qsizetype child) {
        hasChildElements = hasChildElements || !subtree.node(child).isText();
    });

    if (hasChildElements)
        return renderMap(subtree, index);
    if (node.attributesBegin != node.attributesEnd)
        return renderSharedLeaf(subtree, index);
    QString leaf;
    for (qsizetype child = index + 1; child < node.end; ++child)
        leaf += subtree.node(child).text;
    return leaf.isNull() ? EmptyText : leaf;
}

// Replies repeat elements of attributes and text from alarm to alarm (a state with its code, a
// device with its kind and zone): each distinct one is rendered once and its map shared by the
// alarms, as ReplyTokenizer shares repeated texts.
QVariant AlarmMapBuilder::renderSharedLeaf(const AlarmSubtree& subtree, qsizetype index)
{
    // Up to this many distinct elements of up to SharedLeafLength characters of content are
    // remembered.
    constexpr qsizetype SharedLeaves = 1024;
    constexpr qsizetype SharedLeafLength = 256;

    // The content as one text: each attribute as name, NUL, value, NUL, then NUL and the text.
    // Neither names nor values hold a NUL and names are never empty, so the text is unambiguous.
    const SubtreeNode& node = subtree.node(index);
    m_leafKey.resize(0); // keeps the capacity
    for (qsizetype a = node.attributesBegin; a < node.attributesEnd; ++a) {
        const ReplyAttribute& attribute = subtree.attribute(a);
        m_leafKey.append(attribute.name).append(QChar(0)).append(attribute.value).append(QChar(0));
    }
    m_leafKey.append(QChar(0));
    forEachChild(subtree, index, [&](qsizetype child) {
        if (!subtree.node(child).xmlWhitespace)
            m_leafKey.append(subtree.node(child).text);
    });
    if (m_leafKey.size() > SharedLeafLength)
        return renderMap(subtree, index);
    const auto it = m_sharedLeaves.constFind(m_leafKey);
    if (it != m_sharedLeaves.cend())
        return *it;
    QVariant rendering = renderMap(subtree, index);
    if (m_sharedLeaves.size() < SharedLeaves)
        m_sharedLeaves.insert(m_leafKey, rendering);
    return rendering;
}

QVariant AlarmMapBuilder::renderMap(const AlarmSubtree& subtree, qsizetype index)
{
    const SubtreeNode& node = subtree.node(index);
    // The entries in document order, then sorted by key so that each goes in at the map's end
    // without searching; repeated names stay in document order and become a list.
    QVarLengthArray<Entry, 32> entries;
    for (qsizetype a = node.attributesBegin; a < node.attributesEnd; ++a) {
        const ReplyAttribute& attribute = subtree.attribute(a);
        entries.append({keyId(attribute.name, m_attributeKeys, u"@"), attribute.value});
    }
    QString text;
    forEachChild(subtree, index, [&](qsizetype child) {
        const SubtreeNode& childNode = subtree.node(child);
        if (!childNode.isText())
            entries.append({keyId(childNode.name, m_elementKeys, {}), renderNode(subtree, child)});
        else if (!childNode.xmlWhitespace)
            text += childNode.text;
    });
    if (!text.isEmpty())
        entries.append({0, text}); // "#text" is the first key

    // Positions ordered by key, ties in document order: by rank where every key has one (the
    // common case, compared as numbers), else by the keys' texts.
    QVarLengthArray<std::pair<int, int>, 32> order;
    bool allRanked = true;
    for (int i = 0; i < int(entries.size()); ++i) {
        const int rank = m_keyRanks[std::size_t(entries[i].key)];
        allRanked = allRanked && rank != Unranked;
        order.append({rank, i});
    }
    if (allRanked) {
        std::sort(order.begin(), order.end());
    } else {
        std::sort(order.begin(), order.end(), [&](const auto& a, const auto& b) {
            const int keyA = entries[a.second].key;
            const int keyB = entries[b.second].key;
            return keyA == keyB ? a.second < b.second : keyLess(keyA, keyB);
        });
    }

    std::map<QString, QVariant> content;
    for (auto it = order.cbegin(); it != order.cend();) {
        const int key = entries[it->second].key;
        const auto next = std::find_if(it + 1, order.cend(), [&](const auto& position) {
            return entries[position.second].key != key;
        });
        QVariant value;
        if (next - it == 1) {
            value = std::move(entries[it->second].value);
        } else {
            QVariantList repeated;
            repeated.reserve(next - it);
            for (auto same = it; same != next; ++same)
                repeated.append(std::move(entries[same->second].value));
            value = repeated;
        }
        content.emplace_hint(content.cend(), m_keys[std::size_t(key)], std::move(value));
        it = next;
    }
    return QVariantMap(std::move(content));
}

// The number of the map key prefix + name.
int AlarmMapBuilder::keyId(QStringView name, QHash<QStringView, int>& cache, QStringView prefix)
{
    const auto it = cache.constFind(name);
    if (it != cache.cend())
        return *it;
    const int id = int(m_keys.size());
    QString key;
    key.reserve(prefix.size() + name.size());
    m_keys.push_back(key.append(prefix).append(name));
    m_keyRanks.push_back(Unranked);
    m_unrankedKeys.push_back(id);
    cache.insert(name, id);
    return id;
}

// Sorts the new keys and merges them into the ranked ones.
void AlarmMapBuilder::rankNewKeys()
{
    const auto byText = [this](int a, int b) {
        return m_keys[std::size_t(a)] < m_keys[std::size_t(b)];
    };
    std::sort(m_unrankedKeys.begin(), m_unrankedKeys.end(), byText);
    std::vector<int> order;
    order.reserve(m_rankedKeys.size() + m_unrankedKeys.size());
    std::merge(m_rankedKeys.cbegin(), m_rankedKeys.cend(), m_unrankedKeys.cbegin(),
               m_unrankedKeys.cend(), std::back_inserter(order), byText);
    for (std::size_t rank = 0; rank < order.size(); ++rank)
        m_keyRanks[std::size_t(order[rank])] = int(rank);
    m_rankedKeys = std::move(order);
    m_unrankedKeys.clear();
}

// The order of QVariantMap keys: by rank where both are ranked, which is the order of their
// texts, else by the texts themselves.
bool AlarmMapBuilder::keyLess(int a, int b) const
{
    const int rankA = m_keyRanks[std::size_t(a)];
    const int rankB = m_keyRanks[std::size_t(b)];
    if (rankA != Unranked && rankB != Unranked)
        return rankA < rankB;
    return m_keys[std::size_t(a)] < m_keys[std::size_t(b)];
}
