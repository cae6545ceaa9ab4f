// The built plug-in file as a host sees it: loaded with QPluginLoader, known only through the
// host interface headers.

#include "support/FakeHost.h"

#include <IPluginObjectBase.h>
#include <RequestSenderInfo.h>

#include <QPluginLoader>
#include <QProcess>
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

    // The id the host files the plug-in under; the interface id is checked by every host load.
    void metaData()
    {
        const QJsonObject meta = QPluginLoader(ALARMSEARCH_PLUGIN_FILE).metaData();
        QCOMPARE(meta.value("MetaData").toObject(),
                 (QJsonObject{{"PluginID", "C758778662E44060AC6E2EC5C9AD349B"}}));
    }

    // The shipped module exports its Qt entry points and the trace glue's C symbols, nothing
    // else: its dynamic symbol table as the toolchain's nm reads it.
    void exports()
    {
        QProcess nm;
        nm.start(QStringLiteral(ALARMSEARCH_NM),
                 {"-D", "--defined-only", "--format=just-symbols", ALARMSEARCH_PLUGIN_FILE});
        QVERIFY(nm.waitForFinished());
        QStringList symbols = QString::fromUtf8(nm.readAllStandardOutput()).split('\n');
        symbols.removeAll(QString());
        symbols.sort();
        QCOMPARE(symbols, (QStringList{"LocalTraceOutFuncAlarmSearchSrv", "g_AlarmSearchSrv",
                                       "g_nGivenModIdAlarmSearchSrv", "g_ptTraceInfoAlarmSearchSrv",
                                       "qt_plugin_instance", "qt_plugin_query_metadata_v2"}));
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
