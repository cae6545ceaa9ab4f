// Our stand-in trace library, loaded by its path with the settings of each case; it reads its
// environment when loaded, so each case loads it afresh.

#include <ZoltLogUtl.h>

#include <QtTest>

#include <dlfcn.h>
#include <thread>
#include <vector>

namespace {

class StandIn
{
public:
    StandIn() : m_handle(dlopen(ZOLTLOGUTL_PATH, RTLD_NOW | RTLD_LOCAL))
    {
        if (!m_handle)
            qFatal("cannot load %s: %s", ZOLTLOGUTL_PATH, dlerror());
        auto get = reinterpret_cast<LogTrace_GetGlobalObjectFn>(
            dlsym(m_handle, "LogTrace_GetGlobalObject"));
        if (!get || get(0, &m_object) != 0 || !m_object)
            qFatal("no trace object");
    }
    ~StandIn() { dlclose(m_handle); }
    Q_DISABLE_COPY_MOVE(StandIn)

    int32_t registerModule(const char* name) const
    {
        int32_t id = -1;
        m_object->registerModule(m_object->context, 19, name, &id);
        return id;
    }

    // Writes like the glue does: a check, then the line if the check passed.
    Q_ATTRIBUTE_FORMAT_PRINTF(4, 5)
    bool trace(int32_t moduleId, int level, const char* format, ...) const
    {
        const int64_t code = static_cast<int32_t>(moduleId << 8 | level);
        if (m_object->checkLevel(m_object->context, code, 0, __FILE__, __LINE__) != 0)
            return false;
        va_list args;
        va_start(args, format);
        m_object->output(m_object->context, format, args);
        va_end(args);
        return true;
    }

private:
    void* m_handle;
    TraceGlobalObject* m_object = nullptr;
};

const QRegularExpression
    linePattern(QStringLiteral(R"(^(\d{4}-\d\d-\d\dT\d\d:\d\d:\d\d\.\d{3}Z) (\S+) (\d+) (.*)$)"));

} // namespace

class TestZoltLogUtl : public QObject
{
    Q_OBJECT

private slots:
    void init()
    {
        QVERIFY(m_dir.isValid());
        m_path = m_dir.filePath(QStringLiteral("trace.log"));
        QFile::remove(m_path);
        qputenv("ZOLTLOG_FILE", QFile::encodeName(m_path));
        qunsetenv("ZOLTLOG_LEVEL");
    }

    void registration()
    {
        const StandIn library;
        QCOMPARE(library.registerModule("AlarmSearchSrv"), 1);
        QCOMPARE(library.registerModule("Other"), 2);
        QCOMPARE(library.registerModule("AlarmSearchSrv"), 1);
    }

    void lineFormat()
    {
        const QDateTime before = QDateTime::currentDateTimeUtc().addMSecs(-1);
        {
            const StandIn library;
            const int32_t id = library.registerModule("AlarmSearchSrv");
            QVERIFY(library.trace(id, 2, "%s, QryAlarmList failed, %s", "queryAlarmCB", "8001"));
        }
        const QDateTime after = QDateTime::currentDateTimeUtc();
        const QStringList lines = readLines();
        QCOMPARE(lines.size(), 1);
        const QRegularExpressionMatch match = linePattern.match(lines.first());
        QVERIFY2(match.hasMatch(), qPrintable(lines.first()));
        const QDateTime stamp = QDateTime::fromString(match.captured(1), Qt::ISODateWithMs);
        QCOMPARE(stamp.timeSpec(), Qt::UTC);
        QVERIFY(stamp >= before && stamp <= after);
        QCOMPARE(match.captured(2), QStringLiteral("AlarmSearchSrv"));
        QCOMPARE(match.captured(3), QStringLiteral("2"));
        QCOMPARE(match.captured(4), QStringLiteral("queryAlarmCB, QryAlarmList failed, 8001"));
    }

    void levels_data()
    {
        QTest::addColumn<QByteArray>("setting");
        QTest::addColumn<int>("level");
        QTest::addColumn<bool>("written");
        QTest::newRow("default writes failures") << QByteArray() << 2 << true;
        QTest::newRow("default skips level 3") << QByteArray() << 3 << false;
        QTest::newRow("default skips entry lines") << QByteArray() << 5 << false;
        QTest::newRow("5 writes entry lines") << QByteArray("5") << 5 << true;
        QTest::newRow("5 skips level 6") << QByteArray("5") << 6 << false;
        QTest::newRow("0 writes nothing") << QByteArray("0") << 2 << false;
        QTest::newRow("0 skips level 1") << QByteArray("0") << 1 << false;
        QTest::newRow("1 writes level 1") << QByteArray("1") << 1 << true;
        QTest::newRow("invalid keeps default") << QByteArray("verbose") << 2 << true;
        QTest::newRow("invalid keeps default, level 5") << QByteArray("5x") << 5 << false;
    }

    void levels()
    {
        QFETCH(QByteArray, setting);
        QFETCH(int, level);
        QFETCH(bool, written);
        if (!setting.isNull())
            qputenv("ZOLTLOG_LEVEL", setting);
        {
            const StandIn library;
            const int32_t id = library.registerModule("AlarmSearchSrv");
            QCOMPARE(library.trace(id, level, "line %d", level), written);
        }
        const QStringList lines = readLines();
        QCOMPARE(lines.size(), written ? 1 : 0);
        if (written)
            QVERIFY(
                lines.first().endsWith(QStringLiteral(" AlarmSearchSrv %1 line %1").arg(level)));
    }

    // Lines from several threads never mix, and each carries its own thread's module and level.
    void concurrentLines()
    {
        qputenv("ZOLTLOG_LEVEL", "5");
        constexpr int Threads = 4;
        constexpr int LinesPerThread = 200;
        {
            const StandIn library;
            const int32_t ids[2] = {library.registerModule("ModuleA"),
                                    library.registerModule("ModuleB")};
            std::vector<std::thread> threads;
            threads.reserve(Threads);
            for (int t = 0; t < Threads; ++t) {
                threads.emplace_back([&library, &ids, t] {
                    for (int i = 0; i < LinesPerThread; ++i)
                        library.trace(ids[t % 2], 2 + t, "thread %d line %d %s", t, i,
                                      "padding-padding-padding-padding-padding-padding");
                });
            }
            for (std::thread& thread : threads)
                thread.join();
        }
        const QStringList lines = readLines();
        QCOMPARE(lines.size(), Threads * LinesPerThread);
        const QRegularExpression text(
            QStringLiteral(R"(^thread (\d) line \d+ padding(-padding){5}$)"));
        for (const QString& line : lines) {
            const QRegularExpressionMatch match = linePattern.match(line);
            QVERIFY2(match.hasMatch(), qPrintable(line));
            const QRegularExpressionMatch textMatch = text.match(match.captured(4));
            QVERIFY2(textMatch.hasMatch(), qPrintable(line));
            const int thread = textMatch.captured(1).toInt();
            QCOMPARE(match.captured(2),
                     thread % 2 ? QStringLiteral("ModuleB") : QStringLiteral("ModuleA"));
            QCOMPARE(match.captured(3).toInt(), 2 + thread);
        }
    }

private:
    QStringList readLines() const
    {
        QFile file(m_path);
        if (!file.open(QIODevice::ReadOnly))
            return {};
        const QString content = QString::fromUtf8(file.readAll());
        if (!content.isEmpty() && !content.endsWith(QLatin1Char('\n')))
            return {QStringLiteral("unterminated: ") + content};
        return content.split(QLatin1Char('\n'), Qt::SkipEmptyParts);
    }

    QTemporaryDir m_dir;
    QString m_path;
};

QTEST_GUILESS_MAIN(TestZoltLogUtl)
#include "tst_zoltlogutl.moc"
