#pragma once

#include <QString>

#include <cstdio>

// Whether a standard stream is an interactive terminal.
bool isTerminal(std::FILE* stream);
// Columns of the terminal on standard output; else $COLUMNS; else 0 (no limit).
int terminalWidth();

// SIGINT and SIGTERM, once caught, only set a flag that long work polls, so that it can stop
// cleanly (a file being written is discarded rather than left half-written).
void catchInterrupts();
bool interrupted();

// A one-line progress display on standard error, drawn only when that is a terminal: a bar when
// the total is known, else a running count.
class ProgressBar
{
public:
    // total < 0: unknown.
    ProgressBar(const QString& label, qint64 total, bool wanted = true);
    ~ProgressBar();
    void advance(qint64 steps = 1);

private:
    QString m_label;
    qint64 m_total;
    qint64 m_done = 0;
    bool m_visible;
};
