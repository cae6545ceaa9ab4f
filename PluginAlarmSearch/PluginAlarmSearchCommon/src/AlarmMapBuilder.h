#pragma once

#include "AlarmSubtree.h"

#include <QHash>
#include <QString>
#include <QVariant>

#include <vector>

// Renders captured elements as XML2Json::parse renders them. Map keys ("@" + attribute name,
// element names, "#text") are numbered as they first turn up and shared by every map built, so
// that entries are sorted by number rather than by text wherever the keys' order is known.
class AlarmMapBuilder
{
public:
    // The rendering of the subtree's node at index: its text, or a QVariantMap.
    QVariant render(const AlarmSubtree& subtree, qsizetype index);

private:
    struct Entry
    {
        int key;
        QVariant value;
    };

    QVariant renderNode(const AlarmSubtree& subtree, qsizetype index);
    QVariant renderSharedLeaf(const AlarmSubtree& subtree, qsizetype index);
    QVariant renderMap(const AlarmSubtree& subtree, qsizetype index);
    int keyId(QStringView name, QHash<QStringView, int>& cache, QStringView prefix);
    void rankNewKeys();
    bool keyLess(int a, int b) const;

    std::vector<QString> m_keys;
    // Each key's place in the order of a QVariantMap, or Unranked for keys that turned up after
    // the last ranking; those are compared by their text.
    std::vector<int> m_keyRanks;
    std::vector<int> m_rankedKeys;         // in the order of their texts
    std::vector<int> m_unrankedKeys;       // in the order they turned up
    QHash<QStringView, int> m_elementKeys; // keys view the reply text
    QHash<QStringView, int> m_attributeKeys;
    QHash<QString, QVariant> m_sharedLeaves; // keyed by content, as renderSharedLeaf writes it
    QString m_leafKey;                       // reused for each lookup
};
