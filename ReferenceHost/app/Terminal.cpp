#include "Terminal.h"

#include <QByteArray>

#include <csignal>
#include <sys/ioctl.h>
#include <unistd.h>

namespace {

volatile std::sig_atomic_t g_interrupted = 0;

extern "C" void onInterrupt(int)
{
    g_interrupted = 1;
}

} // namespace

bool isTerminal(std::FILE* stream)
{
    return ::isatty(fileno(stream)) == 1;
}

int terminalWidth()
{
    winsize size = {};
    if (isTerminal(stdout) && ::ioctl(fileno(stdout), TIOCGWINSZ, &size) == 0 && size.ws_col > 0)
        return size.ws_col;
    return qMax(0, qEnvironmentVariableIntValue("COLUMNS"));
}

void catchInterrupts()
{
    std::signal(SIGINT, onInterrupt);
    std::signal(SIGTERM, onInterrupt);
}

bool interrupted()
{
    return g_interrupted != 0;
}

ProgressBar::ProgressBar(const QString& label, qint64 total, bool wanted)
    : m_label(label), m_total(total), m_visible(wanted && isTerminal(stderr) && total != 0)
{
}

ProgressBar::~ProgressBar()
{
    if (m_visible && m_done > 0)
        std::fputs("\n", stderr);
}

void ProgressBar::advance(qint64 steps)
{
    m_done += steps;
    if (!m_visible)
        return;
    if (m_total < 0) {
        std::fprintf(stderr, "\r%s: %lld", qPrintable(m_label), static_cast<long long>(m_done));
    } else {
        const int width = 40;
        const int filled = int(qMin(m_done, m_total) * width / m_total);
        const QByteArray bar = QByteArray(filled, '#') + QByteArray(width - filled, '.');
        std::fprintf(stderr, "\r%s [%s] %lld/%lld", qPrintable(m_label), bar.constData(),
                     static_cast<long long>(m_done), static_cast<long long>(m_total));
    }
    std::fflush(stderr);
}
