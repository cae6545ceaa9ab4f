#include <AlarmXmlParser.h>

#include <cstdlib>

// getAlarmList refuses a reply beyond its bounds as a whole (an empty list) and otherwise gives
// every alarm whole: no text is empty, and each starts with the alarm's start tag, indented by
// four spaces unless text stands before it.
extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size)
{
    const QString reply = QString::fromUtf8(reinterpret_cast<const char*>(data), qsizetype(size));
    for (const QString& alarm : AlarmXmlParser::getAlarmList(reply)) {
        const QStringView text = alarm.startsWith(QLatin1String("    ")) ? QStringView(alarm).mid(4)
                                                                         : QStringView(alarm);
        if (!text.startsWith(QLatin1String("<Alarm")) || text.size() < 8 ||
            !QStringView(u" />").contains(text[6]))
            std::abort();
    }
    return 0;
}
