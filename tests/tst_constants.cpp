#include <PluginAlarmSearchCommon.h>

#include <QtTest>

using namespace PluginAlarmSearchCommon;

class TestConstants : public QObject
{
    Q_OBJECT

private slots:
    void filterFragments_data()
    {
        QTest::addColumn<QString>("fragment");
        QTest::addColumn<int>("length");
        QTest::addColumn<int>("events");
        QTest::addColumn<QString>("ending");
        QTest::newRow("camera") << CAMERA_TRIGGER_EVENT_FILTER_STRING << 1438 << 32
                                << "<Event>RecErr</Event>";
        QTest::newRow("system") << SYSTEM_TRIGGER_EVENT_FILTER_STRING << 380 << 14
                                << "<Event>QuarantineEvent</Event>\n";
        QTest::newRow("external device") << EXTERNAL_DEVICE_TRIGGER_EVENT_FILTER_STRING << 328 << 9
                                         << "<Event>ManualEvent</Event>";
    }

    void filterFragments()
    {
        QFETCH(QString, fragment);
        QFETCH(int, length);
        QFETCH(int, events);
        QFETCH(QString, ending);
        QCOMPARE(fragment.size(), length);
        QVERIFY(fragment.startsWith(QLatin1String("\n<Event")));
        QVERIFY(fragment.endsWith(ending));
        QCOMPARE(fragment.count(QLatin1String("</Event>")), events);
        QCOMPARE(fragment.count(QLatin1Char('\n')), fragment.endsWith('\n') ? events + 1 : events);
    }

    void sampleLines()
    {
        QVERIFY(CAMERA_TRIGGER_EVENT_FILTER_STRING.contains(
            "\n<Event CameraEvent=\"PPTZTrigger\">CamEvent</Event>\n"));
        QVERIFY(CAMERA_TRIGGER_EVENT_FILTER_STRING.contains(
            "\n<Event VCAEvent=\"RestrictedZoneDetection\">VCA</Event>\n"));
        QVERIFY(EXTERNAL_DEVICE_TRIGGER_EVENT_FILTER_STRING.contains(
            "\n<Event ExtDeviceEvent=\"DO\">DIOStatus</Event>\n"));
    }

    void pluginId()
    {
        QCOMPARE(sizeof(PALARMSEARCH_PLUGINID), size_t(33));
        QCOMPARE(QString::fromUtf8(PALARMSEARCH_PLUGINID),
                 QStringLiteral("C758778662E44060AC6E2EC5C9AD349B"));
    }
};

QTEST_GUILESS_MAIN(TestConstants)
#include "tst_constants.moc"
