#include "FuzzSupport.h"

#include <MessageComposer.h>
#include <PluginAlarmSearchCommon.h>

#include <QRegularExpression>

#include <algorithm>

using namespace PluginAlarmSearchCommon;

// Input: text fields (see fuzzedText) for the alarm IDs (separated by commas), the state and the
// note; the last bytes give the UTF-16 choice, the mute flag and the mute interval.
extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size)
{
    FuzzedDataProvider input(data, size);
    const bool utf16 = input.ConsumeBool();
    const bool mute = input.ConsumeBool();
    const int interval = input.ConsumeIntegral<int>();
    const QStringList ids = fuzzedText(input, utf16).split(QLatin1Char(','));
    const QString state = fuzzedText(input, utf16);
    const QString note = fuzzedText(input, utf16);
    // An empty state stands for a status map without a state, which still writes "<Status>".
    const QVariantMap status{{state.isEmpty() ? QStringLiteral("other") : ARG_ALARM_STATUS, state}};

    // Refused only when an alarm ID holds a character XML cannot carry, which a round trip
    // through UTF-8 replaces.
    const auto carried = [](const QString& id) {
        return QString::fromUtf8(id.toUtf8()) == id &&
               !id.contains(
                   QRegularExpression("[\\x00-\\x08\\x0b\\x0c\\x0e-\\x1f\\x{fffe}\\x{ffff}]"));
    };
    const bool allCarried = std::all_of(ids.cbegin(), ids.cend(), carried);

    MessageComposer composer;
    requireWellFormed(composer.composeProcessAlarmMessage(ids, status, note),
                      QStringLiteral("ProcessAlarm"), !allCarried);
    requireWellFormed(composer.composeGetAlarmInfoMessage(ids.constFirst()),
                      QStringLiteral("GetAlarmInfo"), !carried(ids.constFirst()));
    requireWellFormed(composer.composeMuteAlarmMessage(ids, mute, interval),
                      QStringLiteral("MuteAlarm"), !allCarried);
    return 0;
}
