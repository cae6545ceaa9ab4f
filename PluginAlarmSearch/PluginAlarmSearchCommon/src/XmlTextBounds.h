#pragma once

#include "AlarmSearchLimits.h"

#include <QChar>
#include <QStringView>

#include <utility>

namespace AlarmSearchLimits {

// Whether text may be handed to QXmlStreamReader or QDomDocument, judged in one linear pass
// before either sees it:
// - no lone UTF-16 surrogate: the readers would turn it into "?" and report success, so the
//   value that reached the client would not be the one the server sent;
// - no tag with more than MaxAttributes attributes (counted as the "=" outside quoted values),
//   which the readers would check for duplicates in quadratic time.
// Comments, CDATA sections, processing instructions and declarations are passed over.
inline bool withinTextBounds(QStringView text)
{
    enum class State { Content, Tag, Quoted, Skipped };
    State state = State::Content;
    char16_t quote = 0;
    QStringView skipEnd;    // the text that ends a skipped construct
    qsizetype skipFrom = 0; // where its content begins
    int attributes = 0;
    const qsizetype size = text.size();
    for (qsizetype i = 0; i < size; ++i) {
        const char16_t c = text[i].unicode();
        if (QChar::isSurrogate(c)) {
            if (!QChar::isHighSurrogate(c) || i + 1 == size || !text[i + 1].isLowSurrogate())
                return false;
            ++i;
            continue;
        }
        switch (state) {
        case State::Content: {
            if (c != u'<')
                break;
            // Constructs whose content is not markup, by their opening and closing text.
            static constexpr std::pair<QStringView, QStringView> Skipped[] = {
                {u"<!--", u"-->"}, {u"<![CDATA[", u"]]>"}, {u"<?", u"?>"}, {u"<!", u">"}};
            state = State::Tag;
            attributes = 0;
            const QStringView rest = text.mid(i);
            for (const auto& [opening, closing] : Skipped) {
                if (rest.startsWith(opening)) {
                    state = State::Skipped;
                    skipEnd = closing;
                    skipFrom = i + opening.size();
                    break;
                }
            }
            break;
        }
        case State::Tag:
            if (c == u'>') {
                state = State::Content;
            } else if (c == u'"' || c == u'\'') {
                quote = c;
                state = State::Quoted;
            } else if (c == u'=' && ++attributes > MaxAttributes) {
                return false;
            }
            break;
        case State::Quoted:
            if (c == quote)
                state = State::Tag;
            break;
        case State::Skipped:
            if (c == skipEnd.back() && i + 1 - skipEnd.size() >= skipFrom &&
                text.left(i + 1).endsWith(skipEnd))
                state = State::Content;
            break;
        }
    }
    return true;
}

} // namespace AlarmSearchLimits
