#pragma once

#include <QStringList>
#include <QtGlobal>

#include <dlfcn.h>

// The recording library the glue has loaded, reached without linking it. Its journal holds one
// entry per call: "register <kind> <module>", "check <level code> <reserved> <file>:<line>",
// "out <line>".
class TraceRecorderClient
{
public:
    TraceRecorderClient() : m_handle(dlopen("libZoltLogUtl.dylib", RTLD_LAZY | RTLD_NOLOAD)) {}
    ~TraceRecorderClient()
    {
        if (m_handle)
            dlclose(m_handle);
    }
    Q_DISABLE_COPY_MOVE(TraceRecorderClient)

    bool isLoaded() const { return m_handle; }
    QStringList journal() const
    {
        return m_handle ? QString::fromUtf8(call<const char* (*)()>("TraceRecorder_journal")())
                              .split(QLatin1Char('\n'), Qt::SkipEmptyParts)
                        : QStringList();
    }
    // The entries of one kind ("out ", "check "), without that prefix.
    QStringList entries(const QString& kind = QStringLiteral("out ")) const
    {
        QStringList out;
        for (const QString& entry : journal())
            if (entry.startsWith(kind))
                out << entry.mid(kind.size());
        return out;
    }
    void reset() const
    {
        if (m_handle)
            call<void (*)()>("TraceRecorder_reset")();
    }
    void refuse(qint64 levelCode) const
    {
        if (m_handle)
            call<void (*)(int64_t)>("TraceRecorder_refuse")(levelCode);
    }

private:
    template <typename Fn> Fn call(const char* name) const
    {
        return reinterpret_cast<Fn>(dlsym(m_handle, name));
    }

    void* m_handle;
};
