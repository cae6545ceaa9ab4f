#pragma once

#include <QByteArray>
#include <QFile>
#include <QSaveFile>
#include <QString>

// Where a command writes its output: standard output, or a file written under a temporary name
// in the same folder and renamed to its own only when commit() is called, so that a failed or
// interrupted run leaves no partial file under that name (and an older file stays intact).
class OutputFile
{
public:
    // fileName empty or "-": standard output.
    bool open(const QString& fileName, QString* errorMessage);
    bool write(const QByteArray& bytes, QString* errorMessage);
    bool commit(QString* errorMessage);
    bool isTerminal() const;

private:
    QString m_fileName;
    QFile m_stdout;
    QSaveFile m_saveFile;
    QFileDevice* m_device = nullptr;
};
