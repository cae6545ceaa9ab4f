#include "Search.h"

#include "Cli.h"

#include <AlarmSearchLimits.h>
#include <AnswerFormat.h>

bool runSearch(Cli& cli, const QString& method, const QVariantMap& args, bool all,
               const AlarmPager::PageSink& sink, bool* truncated, int* exitCode)
{
    const AlarmPager::PageQuery searchOnce = [&](const QVariantMap& windowArgs, QVariantList* page,
                                                 QString* error) {
        QList<PluginAnswer> answers;
        if (!cli.session().call(method, windowArgs, cli.timeoutMs(), &answers, error))
            return false;
        const PluginAnswer& answer = answers.constLast();
        if (answer.resultCode != QLatin1String("0")) {
            *error = cli.answerError(method, answer);
            return false;
        }
        *page = AnswerFormat::alarms(answer, cli.keepXml());
        return true;
    };

    QString error;
    if (!all) {
        QVariantList page;
        if (!searchOnce(args, &page, &error) || !sink(page, &error)) {
            *exitCode = cli.fail(error);
            return false;
        }
        *truncated = page.size() >= AlarmSearchLimits::MaxRecords;
        if (*truncated)
            cli.printError(QStringLiteral("the server returned %1 alarms, its limit per search: "
                                          "older matches may be missing; use --all to fetch "
                                          "them all")
                               .arg(page.size()));
        return true;
    }

    AlarmPager pager(searchOnce);
    if (!pager.fetchAll(args, sink, &error)) {
        *exitCode = cli.fail(error);
        return false;
    }
    *truncated = !pager.warning().isEmpty();
    if (*truncated)
        cli.printError(pager.warning());
    return true;
}
