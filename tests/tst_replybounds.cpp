#include "support/FakeTunnelClient.h"

#include <AlarmXmlParser.h>
#include <ORVOSrvTunnelControl.h>
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
    for (int i = 1; i < depth; ++i) {
        QDomElement parent = document.createElement(QStringLiteral("e"));
        parent.appendChild(top);
        top = parent;
    }
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

struct QueryOutcome
{
    int calls = 0;
    bool ok = true;
};

QueryOutcome query(const QString& reply)
{
    QueryOutcome outcome;
    ORVOSrvTunnelControl::queryAlarmCB(
        true, QString(), QStringLiteral("0"), reply, true,
        [&outcome](bool ok, bool, const QVariant&, const QString&, const QString&) {
            ++outcome.calls;
            outcome.ok = ok;
        });
    return outcome;
}

} // namespace

class TestReplyBounds : public QObject
{
    Q_OBJECT

private slots:
    void deepReplies_data()
    {
        QTest::addColumn<QString>("reply");
        QTest::newRow("100000 levels") << nested(Deep, true);
        QTest::newRow("100000 levels, unclosed") << nested(Deep, false);
        QTest::newRow("100000 levels inside an alarm")
            << "<QryAlarmListRes><Alarm>" + nested(Deep, true) + "</Alarm></QryAlarmListRes>";
        QTest::newRow("one level too deep") << "<QryAlarmListRes><Alarm>" +
                                                   nested(AlarmXmlParser::MaxDepth - 1, true) +
                                                   "</Alarm></QryAlarmListRes>";
    }

    // Refused before any DOM is built, and without recursion.
    void deepReplies()
    {
        QFETCH(QString, reply);
        QCOMPARE(AlarmXmlParser::getAlarmList(reply), QList<QString>());
        QCOMPARE(AlarmXmlParser::readAlarmListReply(reply), std::nullopt);
        const QueryOutcome outcome = query(reply);
        QCOMPARE(outcome.calls, 1);
        QVERIFY(!outcome.ok);
    }

    void deepestAccepted()
    {
        const QString reply = "<QryAlarmListRes><Alarm>" +
                              nested(AlarmXmlParser::MaxDepth - 2, true) +
                              "</Alarm></QryAlarmListRes>";
        QCOMPARE(AlarmXmlParser::getAlarmList(reply).size(), 1);
        QCOMPARE(AlarmXmlParser::readAlarmListReply(reply)->size(), 1);
    }

    void deepNodes_data()
    {
        QTest::addColumn<int>("depth");
        QTest::addColumn<bool>("written");
        QTest::newRow("at the bound") << XmlHelper::MaxDepth << true;
        QTest::newRow("one past the bound") << XmlHelper::MaxDepth + 1 << false;
        QTest::newRow("100000 levels") << Deep << false;
    }

    void deepNodes()
    {
        QFETCH(int, depth);
        QFETCH(bool, written);
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

    void oversizedReply()
    {
        const QString reply = QStringLiteral("<QryAlarmListRes><Alarm/>") +
                              QString(AlarmXmlParser::MaxReplyLength, u' ') +
                              QStringLiteral("</QryAlarmListRes>");
        QCOMPARE(AlarmXmlParser::getAlarmList(reply), QList<QString>());
        QCOMPARE(AlarmXmlParser::readAlarmListReply(reply), std::nullopt);
        QVERIFY(!query(reply).ok);

        // Just within the bound it is read.
        const QString largest =
            reply.left(25) + reply.right(18) + QString(AlarmXmlParser::MaxReplyLength - 43, u' ');
        QCOMPARE(AlarmXmlParser::readAlarmListReply(largest)->size(), 1);
    }

    void hostileReplies_data()
    {
        QTest::addColumn<QString>("reply");
        QTest::newRow("entity bomb")
            << "<!DOCTYPE QryAlarmListRes [<!ENTITY a '" + QString(1000, u'a') + "'><!ENTITY b '" +
                   QStringLiteral("&a;").repeated(1000) + "'>]><QryAlarmListRes><Alarm><N>" +
                   QStringLiteral("&b;").repeated(1000) + "</N></Alarm></QryAlarmListRes>";
        QTest::newRow("document type only")
            << "<!DOCTYPE QryAlarmListRes><QryAlarmListRes><Alarm/></QryAlarmListRes>";
        QTest::newRow("reference to U+0001")
            << "<QryAlarmListRes><Alarm><N>&#1;</N></Alarm></QryAlarmListRes>";
        QTest::newRow("raw U+FFFF") << "<QryAlarmListRes><Alarm><N>" + QString(QChar(0xFFFF)) +
                                           "</N></Alarm></QryAlarmListRes>";
    }

    void hostileReplies()
    {
        QFETCH(QString, reply);
        QCOMPARE(AlarmXmlParser::readAlarmListReply(reply), std::nullopt);
        QVERIFY(!query(reply).ok);
        QVERIFY(AlarmXmlParser::getAlarmList(reply).size() <= 1);
        if (reply.startsWith(QLatin1String("<!DOCTYPE")))
            QCOMPARE(AlarmXmlParser::getAlarmList(reply), QList<QString>());
    }

    // Text full of characters to escape: QDomNode::save escapes in place, in time quadratic in
    // the number of escapes; the fallback route must not.
    void manyEscapesOffTheScannersPath()
    {
        const QString reply = "<QryAlarmListRes><Alarm><!-- not for the scanner --><N>" +
                              QStringLiteral("&amp;&lt;").repeated(500000) +
                              "</N></Alarm></QryAlarmListRes>";
        const std::optional<QVariantList> alarms = AlarmXmlParser::readAlarmListReply(reply);
        QVERIFY(alarms.has_value());
        QCOMPARE(alarms->size(), 1);
        QCOMPARE(alarms->at(0).toMap().value("N").toString().size(), 1000000);
    }
};

QTEST_GUILESS_MAIN(TestReplyBounds)
#include "tst_replybounds.moc"
