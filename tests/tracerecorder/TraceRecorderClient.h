#pragma once

#include "TraceRecorder.h"

#include <QStringList>
#include <QtGlobal>

#include <dlfcn.h>

// The recording library the glue has loaded, reached without linking it.
class TraceRecorderClient
{
public:
    TraceRecorderClient() : m_handle(dlopen("libZoltLogUtl.dylib", RTLD_LAZY | RTLD_NOLOAD))
    {
        if (!m_handle)
            return;
        m_size = resolve<TraceRecorder_journalSizeFn>("TraceRecorder_journalSize");
        m_entry = resolve<TraceRecorder_journalEntryFn>("TraceRecorder_journalEntry");
        m_reset = resolve<TraceRecorder_resetFn>("TraceRecorder_reset");
        m_refuse = resolve<TraceRecorder_refuseFn>("TraceRecorder_refuse");
    }
    ~TraceRecorderClient()
    {
        if (m_handle)
            dlclose(m_handle);
    }
    Q_DISABLE_COPY_MOVE(TraceRecorderClient)

    bool isLoaded() const { return m_handle != nullptr; }

    QStringList journal() const
    {
        QStringList entries;
        for (int32_t i = 0; m_handle && i < m_size(); ++i)
            entries << QString::fromUtf8(m_entry(i));
        return entries;
    }
    // The written lines, and the checks ("<level code> <reserved> <file>:<line>").
    QStringList lines() const { return entries(QStringLiteral("out ")); }
    QStringList checks() const { return entries(QStringLiteral("check ")); }
    void reset() const
    {
        if (m_handle)
            m_reset();
    }
    void refuse(qint64 levelCode) const
    {
        if (m_handle)
            m_refuse(levelCode);
    }

private:
    QStringList entries(const QString& kind) const
    {
        QStringList out;
        for (const QString& entry : journal())
            if (entry.startsWith(kind))
                out << entry.mid(kind.size());
        return out;
    }

    template <typename Fn> Fn resolve(const char* name) const
    {
        auto fn = reinterpret_cast<Fn>(dlsym(m_handle, name));
        if (!fn)
            qFatal("recorder function %s missing", name);
        return fn;
    }

    void* m_handle;
    TraceRecorder_journalSizeFn m_size = nullptr;
    TraceRecorder_journalEntryFn m_entry = nullptr;
    TraceRecorder_resetFn m_reset = nullptr;
    TraceRecorder_refuseFn m_refuse = nullptr;
};
