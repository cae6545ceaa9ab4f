#include <ORVOSrvTunnelControl.h>

#include <cstdlib>

// Input: one byte choosing the reader ('0' alarm list, '1' processing, '2' alarm info), one flag
// byte (bit 0: the exchange succeeded, bit 1: last reply), the status text up to the first line
// break, then the reply text.
extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size)
{
    if (size < 2)
        return 0;
    const int reader = data[0] % 3;
    const bool exchangeOk = data[1] & 1;
    const bool isLast = data[1] & 2;
    const QString rest =
        QString::fromUtf8(reinterpret_cast<const char*>(data + 2), qsizetype(size - 2));
    const qsizetype lineEnd = rest.indexOf(QLatin1Char('\n'));
    const QString statusText = lineEnd < 0 ? rest : rest.left(lineEnd);
    const QString replyText = lineEnd < 0 ? QString() : rest.mid(lineEnd + 1);
    const QString relayPath = QStringLiteral("relay/1");

    // Whatever the reply, the reader calls its completion once, passes the flag, the relay path
    // and the status on unchanged, and hands over a list exactly when it understood the reply.
    int calls = 0;
    auto check = [&](bool ok, bool last, const QVariant& result, const QString& relay) {
        ++calls;
        const bool isList = result.typeId() == QMetaType::QVariantList;
        if (last != isLast || relay != relayPath || ok != isList || (ok && !exchangeOk) ||
            (!ok && result.isValid()))
            std::abort();
    };
    switch (reader) {
    case 0:
        ORVOSrvTunnelControl::queryAlarmCB(
            exchangeOk, relayPath, statusText, replyText, isLast,
            [&](bool ok, bool last, const QVariant& result, const QString& status,
                const QString& relay) {
                check(ok, last, result, relay);
                if (status != statusText)
                    std::abort();
                for (const QVariant& alarm : result.toList()) {
                    if (alarm.toMap().value(QStringLiteral("XML")).typeId() != QMetaType::QString)
                        std::abort();
                }
            });
        break;
    case 1:
        ORVOSrvTunnelControl::processAlarmCB(exchangeOk, relayPath, statusText, replyText, isLast,
                                             check);
        break;
    default:
        ORVOSrvTunnelControl::getAlarmInfoCB(exchangeOk, relayPath, statusText, replyText, isLast,
                                             check);
        break;
    }
    if (calls != 1)
        std::abort();
    return 0;
}
