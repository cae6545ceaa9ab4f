// Our stand-in for the platform trace library: hands out module ids, decides by level which
// lines are written and writes them, one per call, to standard error or to $ZOLTLOG_FILE.

#include <ZoltLogUtl.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <ctime>
#include <mutex>
#include <string>
#include <vector>

namespace {

constexpr int DefaultMaxLevel = 2;

class TraceContext
{
public:
    TraceContext()
    {
        if (const char* level = std::getenv("ZOLTLOG_LEVEL")) {
            char* end = nullptr;
            const long value = std::strtol(level, &end, 10);
            if (end != level && *end == '\0')
                m_maxLevel = value < 0 ? 0 : value > 255 ? 255 : static_cast<int>(value);
        }
        if (const char* path = std::getenv("ZOLTLOG_FILE"); path && *path)
            m_file = std::fopen(path, "a");
    }

    ~TraceContext()
    {
        if (m_file)
            std::fclose(m_file);
    }

    TraceContext(const TraceContext&) = delete;
    TraceContext& operator=(const TraceContext&) = delete;

    // A module registered under the same name again keeps its id.
    int32_t registerModule(const char* name)
    {
        const std::string moduleName = name ? name : "";
        std::lock_guard<std::mutex> lock(m_mutex);
        for (size_t i = 0; i < m_modules.size(); ++i) {
            if (m_modules[i] == moduleName)
                return static_cast<int32_t>(i + 1);
        }
        m_modules.push_back(moduleName);
        return static_cast<int32_t>(m_modules.size());
    }

    bool wants(int64_t levelCode) const
    {
        const int64_t level = levelCode & 0xff;
        const bool wanted = level > 0 && level <= m_maxLevel;
        // The output entry carries no level: the line written next on this thread belongs to
        // the last check that passed.
        s_pendingCode = wanted ? levelCode : NoPendingCode;
        return wanted;
    }

    void write(const char* format, va_list args)
    {
        va_list sizing;
        va_copy(sizing, args);
        const int size = std::vsnprintf(nullptr, 0, format, sizing);
        va_end(sizing);
        if (size < 0)
            return;
        std::string text(static_cast<size_t>(size), '\0');
        std::vsnprintf(text.data(), text.size() + 1, format, args);

        const int64_t code = s_pendingCode;
        s_pendingCode = NoPendingCode;

        std::lock_guard<std::mutex> lock(m_mutex);
        std::string line = timestamp();
        line += ' ';
        line += moduleName(code >> 8);
        line += ' ';
        line += code == NoPendingCode ? std::string("-") : std::to_string(code & 0xff);
        line += ' ';
        line += text;
        line += '\n';
        std::FILE* out = m_file ? m_file : stderr;
        std::fwrite(line.data(), 1, line.size(), out);
        std::fflush(out);
    }

private:
    static constexpr int64_t NoPendingCode = -1;

    static std::string timestamp()
    {
        using namespace std::chrono;
        const auto now = system_clock::now();
        const std::time_t seconds = system_clock::to_time_t(now);
        const auto millis = duration_cast<milliseconds>(now.time_since_epoch()).count() % 1000;
        std::tm utc{};
        gmtime_r(&seconds, &utc);
        char buffer[32];
        const size_t length = std::strftime(buffer, sizeof buffer, "%Y-%m-%dT%H:%M:%S", &utc);
        std::snprintf(buffer + length, sizeof buffer - length, ".%03dZ", static_cast<int>(millis));
        return buffer;
    }

    // Called with m_mutex held.
    std::string moduleName(int64_t moduleId) const
    {
        if (moduleId < 1 || moduleId > static_cast<int64_t>(m_modules.size()))
            return "-";
        return m_modules[static_cast<size_t>(moduleId - 1)];
    }

    static thread_local int64_t s_pendingCode;

    int m_maxLevel = DefaultMaxLevel;
    std::FILE* m_file = nullptr;
    std::mutex m_mutex;
    std::vector<std::string> m_modules;
};

thread_local int64_t TraceContext::s_pendingCode = TraceContext::NoPendingCode;

void registerModule(void* context, int32_t /*kind*/, const char* moduleName, int32_t* moduleId)
{
    const int32_t id = static_cast<TraceContext*>(context)->registerModule(moduleName);
    if (moduleId)
        *moduleId = id;
}

int32_t checkLevel(void* context, int64_t levelCode, int64_t /*reserved*/, const char* /*file*/,
                   int32_t /*line*/)
{
    return static_cast<TraceContext*>(context)->wants(levelCode) ? 0 : 1;
}

void output(void* context, const char* format, va_list args)
{
    if (format)
        static_cast<TraceContext*>(context)->write(format, args);
}

TraceGlobalObject& globalObject()
{
    static TraceContext context;
    static TraceGlobalObject object = [] {
        TraceGlobalObject o{};
        o.context = &context;
        o.registerModule = registerModule;
        o.checkLevel = checkLevel;
        o.output = output;
        return o;
    }();
    return object;
}

} // namespace

extern "C" __attribute__((visibility("default"))) int32_t
LogTrace_GetGlobalObject(int32_t /*reserved*/, TraceGlobalObject** object)
{
    if (!object)
        return -1;
    *object = &globalObject();
    return 0;
}
