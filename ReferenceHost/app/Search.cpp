#include "Search.h"

#include "Cli.h"

#include <AlarmPager.h>
#include <AnswerFormat.h>

bool runSearch(Cli& cli, const QString& method, const QVariantMap& args, bool all,
               QVariantList* alarms, int* exitCode)
{
    const AlarmPager::PageQuery searchOnce = [&](const QVariantMap& windowArgs, QVariantList* page,
                                                 QString* error) {
        QList<PluginAnswer> answers;
        if (!cli.session().call(method, windowArgs, cli.timeoutMs(), &answers, error))
            return false;
        const PluginAnswer& answer = answers.constLast();
        if (answer.resultCode != QLatin1String("0")) {
            *error = QStringLiteral("%1 failed with result code %2").arg(method, answer.resultCode);
            return false;
        }
        *page = AnswerFormat::alarms(answer, cli.keepXml());
        return true;
    };

    QString error;
    if (!all) {
        if (!searchOnce(args, alarms, &error)) {
            *exitCode = cli.fail(error);
            return false;
        }
        if (alarms->size() >= AlarmPager::kMaxRecords)
            cli.printError(QStringLiteral("the server returned %1 alarms, its limit per search: "
                                          "older matches may be missing; use --all to fetch "
                                          "them all")
                               .arg(alarms->size()));
        return true;
    }

    AlarmPager pager(searchOnce);
    if (!pager.fetchAll(args, alarms, &error)) {
        *exitCode = cli.fail(error);
        return false;
    }
    if (!pager.warning().isEmpty())
        cli.printError(pager.warning());
    return true;
}
