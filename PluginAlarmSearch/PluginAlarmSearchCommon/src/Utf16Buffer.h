#pragma once

#include <QStringView>

#include <algorithm>
#include <cstring>
#include <vector>

// Text assembled from many short pieces. Appends are inline, without the library call that a
// string class makes for each piece; the storage is kept when the buffer is cleared.
class Utf16Buffer
{
public:
    void clear() { m_size = 0; }
    QStringView view() const { return QStringView(m_data.data(), qsizetype(m_size)); }

    void append(const char16_t* piece, std::size_t length)
    {
        if (length == 0)
            return; // an empty piece may have no data at all, which memcpy must not be given
        std::memcpy(room(length), piece, length * sizeof(char16_t));
        m_size += length;
    }
    void append(char16_t c)
    {
        *room(1) = c;
        ++m_size;
    }
    void fill(std::size_t count, char16_t c)
    {
        char16_t* const out = room(count);
        for (std::size_t i = 0; i < count; ++i)
            out[i] = c;
        m_size += count;
    }

private:
    // Where the next length characters go, the storage grown to hold them.
    char16_t* room(std::size_t length)
    {
        if (length > m_data.size() - m_size)
            m_data.resize(std::max(2 * m_data.size(), m_size + length));
        return m_data.data() + m_size;
    }

    std::vector<char16_t> m_data; // all of it writable; the text is its first m_size characters
    std::size_t m_size = 0;
};
