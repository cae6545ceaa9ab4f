// The built plug-in file as a host sees it: loaded with QPluginLoader, known only through the
// host interface headers.

#include "support/FakeHost.h"

#include <IPluginObjectBase.h>
#include <RequestSenderInfo.h>

#include <QPluginLoader>
#include <QTemporaryDir>
#include <QtTest>

class TestPluginLoader : public QObject
{
    Q_OBJECT

private slots:
    // Before any load: where the stand-in trace library writes its lines.
    void initTestCase()
    {
        QVERIFY(m_traceDir.isValid());
        qputenv("ZOLTLOG_FILE", QFile::encodeName(m_traceDir.filePath("trace.log")));
        qputenv("ZOLTLOG_LEVEL", "5");
    }

    void metaData()
    {
        QPluginLoader loader(QStringLiteral(ALARMSEARCH_PLUGIN_FILE));
        const QJsonObject meta = loader.metaData();
        QCOMPARE(meta.value("IID").toString(),
                 QStringLiteral("com.KELMARO.PluginServer.PluginInterface"));
        QCOMPARE(meta.value("className").toString(), QStringLiteral("PluginAlarmSearchSrv"));
        QCOMPARE(meta.value("MetaData").toObject(),
                 (QJsonObject{{"PluginID", "C758778662E44060AC6E2EC5C9AD349B"}}));
    }

    void oneGuardedInstance()
    {
        QPluginLoader loader(QStringLiteral(ALARMSEARCH_PLUGIN_FILE));
        QObject* instance = loader.instance();
        QVERIFY2(instance, qPrintable(loader.errorString()));
        QCOMPARE(loader.instance(), instance);
        QVERIFY(qobject_cast<IPluginObjectBase*>(instance));
        QCOMPARE(instance->metaObject()->className(), "PluginAlarmSearchSrv");

        delete instance;
        QObject* renewed = loader.instance();
        QVERIFY(renewed);
        QVERIFY(qobject_cast<IPluginObjectBase*>(renewed));
        delete renewed;
    }

    void servesRequestsAndEvents()
    {
        QPluginLoader loader(QStringLiteral(ALARMSEARCH_PLUGIN_FILE));
        auto* plugin = qobject_cast<IPluginObjectBase*>(loader.instance());
        QVERIFY2(plugin, qPrintable(loader.errorString()));

        FakeHost host;
        QVERIFY(plugin->InitialPluginBase(&host));
        RequestSenderInfo sender;
        sender.clientHandle = reinterpret_cast<Qt::HANDLE>(0x51);
        UntouchedResponser responser;
        plugin->SubscribeEventBlock("key", "AlarmUpdated", QVariant(), sender, responser);

        plugin->Request("QryAlarmList", QVariantMap{{"relayPath", "r"}}, sender, host.answerSink());
        QCOMPARE(host.tunnel.last().method, QStringLiteral("QryAlarmList"));
        QCOMPARE(host.tunnel.last().clientID, sender.clientHandle);
        host.tunnel.replyOnThread(
            {true, "r", "0",
             "<QryAlarmListRes><Alarm><AlarmID>A1</AlarmID></Alarm></QryAlarmListRes>", true});

        plugin->Request("UpdateAlarm",
                        QVariantMap{{"alarmIdList", QStringList{"A1"}}, {"alarmStatus", "Handled"}},
                        sender, host.answerSink());
        host.tunnel.replyOnThread(
            {true, "", "0",
             "<ProcessAlarmRes><Result><AlarmID>A1</AlarmID><Code>0</Code></Result>"
             "</ProcessAlarmRes>",
             true});

        QCOMPARE(host.journal(), (QStringList{"answer 0", "event key", "answer 0"}));
        const QVariantList alarms =
            host.answers().first().result.toMap().value("queryResult").toList();
        QCOMPARE(alarms.size(), 1);
        QCOMPARE(alarms.first().toMap().value("XML").toString(),
                 QStringLiteral("    <Alarm>\n        <AlarmID>A1</AlarmID>\n    </Alarm>\n"));
        QCOMPARE(responser.calls, 0);
        delete plugin;
    }

    // The plug-in finds the trace library installed beside it and writes its lines through it.
    void tracesThroughTheLibraryBesideIt()
    {
#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
        QSKIP("the sanitizer runtime's dlopen does not search the plug-in's run path");
#endif
        QPluginLoader loader(QStringLiteral(ALARMSEARCH_PLUGIN_FILE));
        auto* plugin = qobject_cast<IPluginObjectBase*>(loader.instance());
        QVERIFY2(plugin, qPrintable(loader.errorString()));
        FakeHost host;
        host.tunnel.setAccept(false);
        plugin->InitialPluginBase(&host);
        plugin->Request("GetAlarmHistory", QVariantMap(), RequestSenderInfo(), host.answerSink());
        delete plugin;

        QFile log(m_traceDir.filePath("trace.log"));
        QVERIFY(log.open(QIODevice::ReadOnly));
        const QString text = QString::fromUtf8(log.readAll());
        QVERIFY2(
            text.contains(" AlarmSearchSrv 2 handleGetAlarmHistory, call getAlarmInfo failed\n"),
            qPrintable(text));
        QVERIFY(text.contains(" AlarmSearchSrv 5 Request, Leave\n"));
    }

private:
    QTemporaryDir m_traceDir;
};

QTEST_GUILESS_MAIN(TestPluginLoader)
#include "tst_pluginloader.moc"
