#pragma once

#include <QMutex>
#include <QWaitCondition>

// Counts units of work in flight across threads and lets a thread wait until none is left.
class PendingWork
{
public:
    void begin();
    void end();
    bool waitForIdle(int timeoutMs);

private:
    QMutex m_mutex;
    QWaitCondition m_idle;
    int m_count = 0;
};
