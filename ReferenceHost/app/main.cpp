#include "Cli.h"

#include <QCoreApplication>

int main(int argc, char* argv[])
{
    QCoreApplication app(argc, argv);
    QCoreApplication::setApplicationName(QStringLiteral("alarmsearch"));
    QCoreApplication::setApplicationVersion(QStringLiteral(ALARMSEARCH_VERSION));
    Cli cli;
    return cli.run(QCoreApplication::arguments());
}
