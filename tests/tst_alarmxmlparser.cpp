#include <AlarmXmlParser.h>
#include <XmlHelper.h>

#include <QDomDocument>
#include <QtTest>

class TestAlarmXmlParser : public QObject
{
    Q_OBJECT

private slots:
    void alarmList_data()
    {
        QTest::addColumn<QString>("reply");
        QTest::addColumn<QStringList>("alarms");

        QTest::newRow("single alarm with one attribute")
            << "<QryAlarmListRes><Alarm ID=\"1\"/></QryAlarmListRes>"
            << QStringList{"    <Alarm ID=\"1\"/>\n"};
        QTest::newRow("two alarms and another child, in document order")
            << "<QryAlarmListRes><Alarm ID=\"2\"/><Total>2</Total><Alarm ID=\"1\"/>"
               "</QryAlarmListRes>"
            << QStringList{"    <Alarm ID=\"2\"/>\n", "    <Alarm ID=\"1\"/>\n"};
        QTest::newRow("alarm with a text child")
            << "<QryAlarmListRes>\n  <Alarm>\n    <Name>Door &amp; gate</Name>\n  </Alarm>\n"
               "</QryAlarmListRes>"
            << QStringList{"    <Alarm>\n        <Name>Door &amp; gate</Name>\n    </Alarm>\n"};
        QTest::newRow("white-space-only child in the short form")
            << "<QryAlarmListRes><Alarm><Note>  \n </Note></Alarm></QryAlarmListRes>"
            << QStringList{"    <Alarm>\n        <Note/>\n    </Alarm>\n"};
        QTest::newRow("root name not looked at")
            << "<Other><Alarm/></Other>" << QStringList{"    <Alarm/>\n"};
        QTest::newRow("grandchild and lower-case name not returned")
            << "<QryAlarmListRes><Group><Alarm ID=\"1\"/></Group><alarm ID=\"2\"/>"
               "</QryAlarmListRes>"
            << QStringList();
        QTest::newRow("empty") << "" << QStringList();
        QTest::newRow("not XML") << "Alarm" << QStringList();
        QTest::newRow("truncated inside an alarm")
            << "<QryAlarmListRes><Alarm ID=\"1\"/><Alarm ID=\"2\"><Name>x"
            << QStringList{"    <Alarm ID=\"1\"/>\n",
                           "    <Alarm ID=\"2\">\n        <Name/>\n    </Alarm>\n"};
        QTest::newRow("nothing after the fault")
            << "<QryAlarmListRes><Alarm ID=\"1\"/><Bad<<Alarm ID=\"3\"/></QryAlarmListRes>"
            << QStringList{"    <Alarm ID=\"1\"/>\n"};
    }

    void alarmList()
    {
        QFETCH(QString, reply);
        QFETCH(QStringList, alarms);
        QCOMPARE(AlarmXmlParser::getAlarmList(reply), alarms);
    }

    void childElements_data()
    {
        QTest::addColumn<QString>("tagName");
        QTest::addColumn<QStringList>("visited");
        QTest::newRow("every child") << QString() << QStringList{"A1", "B2", "A3"};
        QTest::newRow("named") << "A" << QStringList{"A1", "A3"};
        QTest::newRow("none") << "C" << QStringList();
    }

    void childElements()
    {
        QFETCH(QString, tagName);
        QFETCH(QStringList, visited);
        QDomDocument document;
        QVERIFY(document.setContent(
            QStringLiteral("<R><A n=\"1\"/>text<B n=\"2\"><A n=\"x\"/></B><A n=\"3\"/></R>")));

        QStringList seen;
        XmlHelper::doSomeThingAllChildElement(
            document.documentElement(), tagName, [&seen](const QDomElement& element) {
                seen.append(element.tagName() + element.attribute(QStringLiteral("n")));
            });
        QCOMPARE(seen, visited);
    }

    void nodeToXml()
    {
        QCOMPARE(XmlHelper::nodeToXml(QDomNode()), QString());

        QDomDocument document;
        QVERIFY(document.setContent(QStringLiteral("<R><A/></R>")));
        QCOMPARE(XmlHelper::nodeToXml(document), QStringLiteral("<R>\n    <A/>\n</R>\n"));
    }
};

QTEST_GUILESS_MAIN(TestAlarmXmlParser)
#include "tst_alarmxmlparser.moc"
