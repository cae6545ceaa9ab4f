#include "PendingWork.h"

#include <QDeadlineTimer>

void PendingWork::begin()
{
    QMutexLocker locker(&m_mutex);
    ++m_count;
}

void PendingWork::end()
{
    QMutexLocker locker(&m_mutex);
    if (--m_count == 0)
        m_idle.wakeAll();
}

bool PendingWork::waitForIdle(int timeoutMs)
{
    QDeadlineTimer deadline(timeoutMs);
    QMutexLocker locker(&m_mutex);
    while (m_count > 0) {
        if (!m_idle.wait(&m_mutex, deadline))
            return m_count == 0;
    }
    return true;
}
