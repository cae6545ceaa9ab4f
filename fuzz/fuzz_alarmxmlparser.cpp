#include <AlarmXmlParser.h>

#include <cstdlib>

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size)
{
    const QString reply = QString::fromUtf8(reinterpret_cast<const char*>(data), qsizetype(size));
    // Every alarm text holds at least its own start tag.
    for (const QString& alarm : AlarmXmlParser::getAlarmList(reply)) {
        if (!alarm.contains(QLatin1String("<Alarm")))
            std::abort();
    }
    return 0;
}
