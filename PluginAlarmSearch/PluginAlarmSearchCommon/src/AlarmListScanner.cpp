#include "AlarmListScanner.h"

#include "AlarmMapBuilder.h"
#include "AlarmSearchLimits.h"
#include "AlarmSubtree.h"
#include "AlarmTextWriter.h"
#include "DomStyleWriter.h"
#include "ReplyTokenizer.h"
#include "Utf16Buffer.h"

namespace {

const QString ReplyName = QStringLiteral("QryAlarmListRes");
const QString AlarmName = QStringLiteral("Alarm");
const QString XmlKey = QStringLiteral("XML");

// Reads the reply: the tokenizer walks the text, each "Alarm" child of the document element is
// captured into a subtree, rendered into its map and written out as its text, one alarm at a
// time; the other children are only checked.
class Scanner
{
public:
    explicit Scanner(const QString& text) : m_tokens(text) {}

    std::optional<QVariantList> run()
    {
        if (!m_tokens.declaration())
            return std::nullopt;
        m_tokens.skipSpace();
        if (!m_tokens.at(u'<'))
            return std::nullopt;
        m_tokens.skip();
        if (!documentElement())
            return std::nullopt;
        m_tokens.skipSpace();
        if (!m_tokens.atEnd())
            return std::nullopt;
        return std::move(m_alarms);
    }

private:
    // After "<": the document element, with each "Alarm" child read into the results when it is
    // a "QryAlarmListRes".
    bool documentElement()
    {
        QStringView elementName;
        bool emptyElement = false;
        std::vector<ReplyAttribute> attributes; // of no interest
        if (!m_tokens.startTag(elementName, emptyElement, attributes))
            return false;
        const bool isReply = elementName == ReplyName;
        while (!emptyElement) {
            // Text the DOM keeps, between two children: the alarm before it takes no line break,
            // the alarm after it no indentation.
            TextRun run;
            if (!m_tokens.text(run, false))
                return false;
            const bool afterText = !run.blank;
            if (m_alarmPending)
                finishAlarmText(afterText);
            const ReplyTokenizer::Markup next = m_tokens.markupAfterText(elementName);
            if (next == ReplyTokenizer::Markup::Fault)
                return false;
            if (next == ReplyTokenizer::Markup::EndTag)
                break;
            // Alarms are counted under any document element, as the general route counts them.
            const bool namedAlarm = m_tokens.peekName() == AlarmName;
            if (namedAlarm && ++m_alarmChildren > AlarmSearchLimits::MaxReplyAlarms)
                return false;
            const bool isAlarm = isReply && namedAlarm;
            if (!m_subtree.capture(m_tokens, 2, isAlarm))
                return false;
            if (isAlarm)
                addAlarm(afterText);
        }
        return true;
    }

    // The alarm just captured.
    void addAlarm(bool afterText)
    {
        QVariant rendering = m_maps.render(m_subtree, 0);
        m_alarm = rendering.toMap();
        rendering.clear();

        // Written into a buffer that keeps its capacity from alarm to alarm; whether a line break
        // ends it is known once the text after the alarm has been read.
        m_xml.clear();
        m_writer.write(m_subtree, 0, 1, afterText);
        m_alarmPending = true;
        m_subtree.clear();
    }

    // Ends the text of the alarm read last and adds the alarm, with a copy of its text of just
    // the right size.
    void finishAlarmText(bool beforeText)
    {
        DomStyleWriter(m_xml).lineBreak(beforeText);
        m_alarm.insert(XmlKey, m_xml.view().toString());
        m_alarms.append(QVariant(m_alarm));
        m_alarm = QVariantMap();
        m_alarmPending = false;
    }

    ReplyTokenizer m_tokens;
    AlarmSubtree m_subtree;
    AlarmMapBuilder m_maps;

    QVariantList m_alarms;
    // The alarm read last, its text in m_xml still without its line break, while m_alarmPending.
    QVariantMap m_alarm;
    Utf16Buffer m_xml;
    AlarmTextWriter m_writer{m_xml};
    bool m_alarmPending = false;
    qsizetype m_alarmChildren = 0;
};

} // namespace

std::optional<QVariantList> AlarmListScanner::read(const QString& replyText)
{
    return Scanner(replyText).run();
}

std::optional<QVariantMap> AlarmListScanner::readDocument(const QString& replyText)
{
    ReplyTokenizer tokens(replyText);
    if (!tokens.declaration())
        return std::nullopt;
    tokens.skipSpace();
    if (!tokens.at(u'<'))
        return std::nullopt;
    tokens.skip();
    AlarmSubtree document;
    if (!document.capture(tokens, 1, true))
        return std::nullopt;
    tokens.skipSpace();
    if (!tokens.atEnd())
        return std::nullopt;
    return QVariantMap{{document.node(0).name.toString(), AlarmMapBuilder().render(document, 0)}};
}
