#include <IPluginObjectBase.h>
#include <PluginLoader.h>

#include <QtTest>

class TestHostPluginLoader : public QObject
{
    Q_OBJECT

private slots:
    void loads_data()
    {
        QTest::addColumn<QString>("file");
        QTest::addColumn<QString>("reason"); // empty: loaded
        QTest::newRow("good plug-in") << QStringLiteral(FIXTURE_GoodPlugin) << QString();
        QTest::newRow("missing file") << "/nonexistent/libNothing.so"
                                      << "no such file";
        QTest::newRow("no Qt plug-in")
            << QStringLiteral(FIXTURE_PlainLibrary) << "not a Qt plug-in";
        QTest::newRow("other interface")
            << QStringLiteral(FIXTURE_OtherIidPlugin)
            << "interface identifier \"com.example.SomeOtherInterface\"";
        QTest::newRow("no PluginID")
            << QStringLiteral(FIXTURE_NoPluginIdPlugin) << "no \"PluginID\"";
        QTest::newRow("not an IPluginObjectBase")
            << QStringLiteral(FIXTURE_PlainObjectPlugin)
            << "instance of PlainObjectPlugin is no IPluginObjectBase";
    }

    void loads()
    {
        QFETCH(QString, file);
        QFETCH(QString, reason);
        PluginLoader loader;
        QString error;
        QCOMPARE(loader.load(file, &error), reason.isEmpty());
        QCOMPARE(loader.plugin() != nullptr, reason.isEmpty());
        QCOMPARE(error.isEmpty(), reason.isEmpty());
        if (reason.isEmpty())
            return;
        // One line: what failed, the loader's own explanation in parentheses, then how to name
        // another file.
        QVERIFY2(error.startsWith("cannot load plug-in " + file) && error.contains(reason) &&
                     !error.contains(u'\n') &&
                     error.endsWith("); name the plug-in file with --plugin or ALARMSEARCH_PLUGIN"),
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
