#include "Terminal.h"

#include <QByteArray>

#include <unistd.h>

bool isTerminal(std::FILE* stream)
{
    return ::isatty(fileno(stream)) == 1;
}

ProgressBar::ProgressBar(int total) : m_total(total), m_visible(isTerminal(stderr) && total > 0) {}

ProgressBar::~ProgressBar()
{
    if (m_visible)
        std::fputs("\n", stderr);
}

void ProgressBar::advance()
{
    ++m_done;
    if (!m_visible)
        return;
    const int width = 40;
    const int filled = int(qint64(m_done) * width / m_total);
    const QByteArray bar = QByteArray(filled, '#') + QByteArray(width - filled, '.');
    std::fprintf(stderr, "\r[%s] %d/%d", bar.constData(), m_done, m_total);
    std::fflush(stderr);
}
