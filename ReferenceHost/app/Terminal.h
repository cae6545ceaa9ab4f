#pragma once

#include <cstdio>

// Whether a standard stream is an interactive terminal.
bool isTerminal(std::FILE* stream);

// A one-line progress bar on standard error, drawn only when that is a terminal.
class ProgressBar
{
public:
    explicit ProgressBar(int total);
    ~ProgressBar();
    void advance();

private:
    int m_total;
    int m_done = 0;
    bool m_visible;
};
