#include <IPluginObjectBase.h>
#include <PluginLoader.h>

#include <QtTest>

class TestHostPluginLoader : public QObject
{
    Q_OBJECT

private slots:
    void loadsGoodPlugin()
    {
        PluginLoader loader;
        QString error;
        QVERIFY2(loader.load(QStringLiteral(FIXTURE_GoodPlugin), &error), qPrintable(error));
        QVERIFY(loader.plugin());
        QVERIFY(error.isEmpty());
    }

    void rejectsBadFiles_data()
    {
        QTest::addColumn<QString>("file");
        QTest::addColumn<QString>("reason");
        QTest::newRow("missing file")
            << QStringLiteral("/nonexistent/libNothing.so") << QStringLiteral("no such file");
        QTest::newRow("no Qt plug-in")
            << QStringLiteral(FIXTURE_PlainLibrary) << QStringLiteral("not a Qt plug-in");
        QTest::newRow("other interface")
            << QStringLiteral(FIXTURE_OtherIidPlugin)
            << QStringLiteral("interface identifier \"com.example.SomeOtherInterface\"");
        QTest::newRow("no PluginID")
            << QStringLiteral(FIXTURE_NoPluginIdPlugin) << QStringLiteral("no \"PluginID\"");
        QTest::newRow("not an IPluginObjectBase")
            << QStringLiteral(FIXTURE_PlainObjectPlugin)
            << QStringLiteral("instance of PlainObjectPlugin is no IPluginObjectBase");
    }

    void rejectsBadFiles()
    {
        QFETCH(QString, file);
        QFETCH(QString, reason);
        PluginLoader loader;
        QString error;
        QVERIFY(!loader.load(file, &error));
        QVERIFY(!loader.plugin());
        QVERIFY2(error.startsWith(QStringLiteral("cannot load plug-in ") + file),
                 qPrintable(error));
        QVERIFY2(error.contains(reason), qPrintable(error));
        QVERIFY2(!error.contains(QLatin1Char('\n')), qPrintable(error));
        // The loader's own explanation comes along, in parentheses, then how to name another file.
        QVERIFY2(error.endsWith(QStringLiteral(
                     "); name the plug-in file with --plugin or ALARMSEARCH_PLUGIN")),
                 qPrintable(error));
    }

    void defaultPathFollowsEnvironment()
    {
        qputenv("ALARMSEARCH_PLUGIN", "/opt/x/libP.so");
        QCOMPARE(PluginLoader::defaultPluginPath(), QStringLiteral("/opt/x/libP.so"));
        qunsetenv("ALARMSEARCH_PLUGIN");
        QCOMPARE(
            PluginLoader::defaultPluginPath(),
            QCoreApplication::applicationDirPath() +
                QStringLiteral("/" ALARMSEARCH_PLUGIN_RELATIVE_DIR "/libPluginAlarmSearchSrv.so"));
    }
};

QTEST_GUILESS_MAIN(TestHostPluginLoader)
#include "tst_hostpluginloader.moc"
