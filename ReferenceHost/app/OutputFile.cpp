#include "OutputFile.h"

#include "Terminal.h"

bool OutputFile::open(const QString& fileName, QString* errorMessage)
{
    if (fileName.isEmpty() || fileName == QLatin1String("-")) {
        m_fileName = QStringLiteral("standard output");
        m_device = &m_stdout;
        if (m_stdout.open(fileno(stdout), QIODevice::WriteOnly, QFileDevice::DontCloseHandle))
            return true;
    } else {
        m_fileName = fileName;
        m_device = &m_saveFile;
        m_saveFile.setFileName(fileName);
        if (m_saveFile.open(QIODevice::WriteOnly))
            return true;
    }
    *errorMessage = QStringLiteral("cannot write %1: %2").arg(m_fileName, m_device->errorString());
    return false;
}

bool OutputFile::write(const QByteArray& bytes, QString* errorMessage)
{
    if (m_device->write(bytes) == bytes.size() && (m_device != &m_stdout || m_stdout.flush()))
        return true;
    *errorMessage = QStringLiteral("cannot write %1: %2").arg(m_fileName, m_device->errorString());
    return false;
}

bool OutputFile::commit(QString* errorMessage)
{
    if (m_device == &m_stdout ? m_stdout.flush() : m_saveFile.commit())
        return true;
    *errorMessage = QStringLiteral("cannot write %1: %2").arg(m_fileName, m_device->errorString());
    return false;
}

bool OutputFile::isTerminal() const
{
    return m_device == &m_stdout && ::isTerminal(stdout);
}
