#include "FuzzSupport.h"

#include <AlarmSearchLimits.h>
#include <MessageComposer.h>
#include <PluginAlarmSearchCommon.h>
#include <XmlHelper.h>

using namespace PluginAlarmSearchCommon;

// Input: text fields (see fuzzedText) for the trigger-event filter, the state filter, the start
// and the end time, then pairs of a rule type and its tags, separated by commas. The last byte
// chooses UTF-16 decoding when odd.
extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size)
{
    FuzzedDataProvider input(data, size);
    const bool utf16 = input.ConsumeBool();
    QVariantMap request{
        {ARG_TRIGGER_EVENT_FILTER, fuzzedText(input, utf16)},
        {ARG_STATE_FILTER, fuzzedText(input, utf16)},
        {ARG_START_TIME, fuzzedText(input, utf16)},
        {ARG_END_TIME, fuzzedText(input, utf16)},
    };
    QVariantList rules;
    while (input.remaining_bytes() > 0) {
        const QString type = fuzzedText(input, utf16);
        rules.append(QVariantMap{
            {QStringLiteral("type"), type},
            {QStringLiteral("tagList"), fuzzedText(input, utf16).split(QLatin1Char(','))},
        });
    }
    request.insert(ARG_RULES, rules);

    // Refused only for a filter fragment that may not be built into a DOM.
    const auto fragmentFits = [](const QString& fragment) {
        return XmlHelper::safeForDom(fragment, AlarmSearchLimits::MaxFragmentLength);
    };
    const bool refusable =
        !fragmentFits(QStringLiteral("<TriggerEventList>%1</TriggerEventList>")
                          .arg(request.value(ARG_TRIGGER_EVENT_FILTER).toString())) ||
        !fragmentFits(request.value(ARG_STATE_FILTER).toString());
    requireWellFormed(MessageComposer().composeQueryAlarmListMessage(request),
                      QStringLiteral("QryAlarmList"), refusable);
    return 0;
}
