#include "support/ReaderRun.h"

#include <AlarmSearchLimits.h>
#include <AlarmXmlParser.h>
#include <XmlHelper.h>

#include <QDomDocument>
#include <QtTest>

namespace {

constexpr int Deep = 100000;

QString nested(int depth, bool closed)
{
    const QString open = QStringLiteral("<e>").repeated(depth);
    return closed ? open + QStringLiteral("</e>").repeated(depth) : open;
}

// An element chain built node by node, which no parser would nest this deep; built from the
// bottom, as appending below a deep node walks all its ancestors. Returns the deepest element.
QDomElement chain(QDomDocument& document, int depth)
{
    const QDomElement deepest = document.createElement(QStringLiteral("e"));
    QDomElement top = deepest;
    for (int i = 1; i < depth; ++i)
        top = document.createElement(QStringLiteral("e")).appendChild(top).parentNode().toElement();
    document.appendChild(top);
    return deepest;
}

// Takes the document's chain apart from the top, one detached level at a time: the DOM's
// destructor recurses once per level.
void dismantle(QDomDocument& document)
{
    QDomNode top = document.removeChild(document.documentElement());
    while (top.hasChildNodes())
        top = top.removeChild(top.firstChild());
}

QString repeated(int count, const QString& pattern)
{
    QString text;
    for (int i = 0; i < count; ++i)
        text += pattern.arg(i);
    return text;
}

QString reply(const QString& alarms, const QString& rootAttributes = {})
{
    return "<QryAlarmListRes" + rootAttributes + ">" + alarms + "</QryAlarmListRes>";
}

} // namespace

class TestReplyBounds : public QObject
{
    Q_OBJECT

private slots:
    // Each row a reply that held a reply thread for seconds, took gigabytes, recursed without
    // bound or altered a value; one past each bound is refused and the bound itself is read.
    // CTest's time limit on this test guards against the quadratic ones coming back.
    void replies_data()
    {
        QTest::addColumn<QString>("reply");
        QTest::addColumn<int>("alarms"); // read by the alarm-list reader; -1: refused
        QTest::addColumn<int>("texts");  // from the splitter
        QTest::addColumn<int>("keys");   // of the first alarm's map
        QTest::addColumn<bool>("othersRead");
        const QString surrogate(QChar(0xD800));
        using namespace AlarmSearchLimits;
        const auto inAlarm = [](int depth) {
            return reply("<Alarm>" + nested(depth, true) + "</Alarm>");
        };
        const QString longest = reply("<Alarm/>" + QString(MaxReplyLength - 43, u' '));
        const auto read = [](const char* name, const QString& reply, int alarms, int keys) {
            QTest::newRow(name) << reply << alarms << alarms << keys << true;
        };
        // Refused by every reader; the splitter may still give texts.
        const auto refused = [](const char* name, const QString& reply, int texts = 0) {
            QTest::newRow(name) << reply << -1 << texts << 0 << false;
        };
        const QString alarms = QStringLiteral("<Alarm/>").repeated(MaxReplyAlarms);

        refused("100000 levels", nested(Deep, true));
        refused("100000 levels, unclosed", nested(Deep, false));
        refused("100000 levels inside an alarm", inAlarm(Deep));
        refused("one level too deep", inAlarm(MaxDepth - 1));
        read("deepest read", inAlarm(MaxDepth - 2), 1, 2);
        read("32000 distinct names in one alarm",
             reply("<Alarm>" + repeated(32000, "<n%1/>") + "</Alarm>"), 1, 32001);
        refused("80000 attributes on an alarm",
                reply("<Alarm" + repeated(80000, " a%1=''") + "/>"));
        refused("80000 attributes on the document element",
                reply("<Alarm/>", repeated(80000, " a%1=''")));
        read("attributes at the bound", reply("<Alarm" + repeated(MaxAttributes, " a%1=''") + "/>"),
             1, MaxAttributes + 1);
        refused("lone surrogate in text", reply("<Alarm><N>a" + surrogate + "</N></Alarm>"));
        refused("lone surrogate in an attribute", reply("<Alarm N='" + surrogate + "'/>"));
        read("alarms at the bound", reply(alarms), MaxReplyAlarms, 1);
        // The other readers take the count of alarms as it comes.
        QTest::newRow("one alarm more") << reply(alarms + "<Alarm/>") << -1 << 0 << 0 << true;
        QTest::newRow("one alarm more under another root")
            << "<R>" + alarms + "<Alarm/></R>" << -1 << 0 << 0 << true;
        read("elements at the bound", reply(QStringLiteral("<A/>").repeated(MaxReplyElements - 1)),
             0, 0);
        refused("one element more", reply(QStringLiteral("<A/>").repeated(MaxReplyElements)));
        read("longest read", longest, 1, 1);
        refused("one character more", longest + ' ');
        // Found by fuzzing: with namespace processing the depth check stopped at the undeclared
        // prefix, where the DOM read on; the alarm came back as an empty text.
        refused("345 unclosed levels with a prefix",
                reply("<Alarm>" + QStringLiteral("<p:e>").repeated(345)).chopped(18));
        // The splitter refuses a document type as a whole and reads the alarm around a character
        // reference or a noncharacter it was not asked to judge.
        refused("entity bomb",
                "<!DOCTYPE QryAlarmListRes [<!ENTITY a '" + QString(1000, u'a') + "'><!ENTITY b '" +
                    QStringLiteral("&a;").repeated(1000) + "'>]>" +
                    reply("<Alarm><N>" + QStringLiteral("&b;").repeated(1000) + "</N></Alarm>"));
        refused("document type only", "<!DOCTYPE QryAlarmListRes>" + reply("<Alarm/>"));
        refused("reference to U+0001", reply("<Alarm><N>&#1;</N></Alarm>"), 1);
        refused("raw U+FFFF", reply("<Alarm><N>" + QString(QChar(0xFFFF)) + "</N></Alarm>"), 1);
    }

    void replies()
    {
        QFETCH(QString, reply);
        QFETCH(int, alarms);
        QFETCH(int, texts);
        QFETCH(int, keys);
        QFETCH(bool, othersRead);
        const std::optional<QVariantList> read = AlarmXmlParser::readAlarmListReply(reply);
        QCOMPARE(read ? int(read->size()) : -1, alarms);
        // The update and history readers read the same form whole.
        for (const Reader reader : {Reader::Query, Reader::Process, Reader::Info}) {
            const ReaderOutcome outcome = readReply(reader, {true, {}, "0", reply, true});
            QCOMPARE(outcome.calls, 1);
            QCOMPARE(outcome.ok, reader == Reader::Query ? alarms >= 0 : othersRead);
        }
        // The splitter gives a text per alarm or nothing, never an alarm cut short.
        const QList<QString> split = AlarmXmlParser::getAlarmList(reply);
        QCOMPARE(split.size(), texts);
        if (alarms > 0) {
            QCOMPARE(read->first().toMap().size(), keys);
            QCOMPARE(read->first().toMap().value("XML").toString(), split.first());
        }
    }

    void deepNodes_data()
    {
        QTest::addColumn<int>("depth");
        for (const int depth : {AlarmSearchLimits::MaxDepth, AlarmSearchLimits::MaxDepth + 1, Deep})
            QTest::addRow("%d levels", depth) << depth;
    }

    void deepNodes()
    {
        QFETCH(int, depth);
        const bool written = depth <= AlarmSearchLimits::MaxDepth;
        QDomDocument document;
        const QDomElement deepest = chain(document, depth);
        const QString xml = XmlHelper::nodeToXml(document.documentElement());
        QCOMPARE(xml.isEmpty(), !written);
        if (written)
            QCOMPARE(xml.count(QLatin1String("<e")), depth);
        // The document node holds one level more.
        QVERIFY(XmlHelper::nodeToXml(document).isEmpty());
        // The deepest element alone is shallow.
        QCOMPARE(XmlHelper::nodeToXml(deepest), QString(4, u' ') + "<e/>\n");
        dismantle(document);
    }

    // Text full of characters to escape: QDomNode::save escapes in place, in time quadratic in
    // the number of escapes; the fallback route must not.
    void manyEscapesOffTheScannersPath()
    {
        const QString reply = "<QryAlarmListRes><Alarm><!-- not for the scanner --><N>" +
                              QStringLiteral("&amp;&lt;").repeated(500000) +
                              "</N></Alarm></QryAlarmListRes>";
        const QVariantList alarms =
            AlarmXmlParser::readAlarmListReply(reply).value_or(QVariantList());
        QCOMPARE(alarms.size(), 1);
        QCOMPARE(alarms.at(0).toMap().value("N").toString().size(), 1000000);
    }
};

QTEST_GUILESS_MAIN(TestReplyBounds)
#include "tst_replybounds.moc"
