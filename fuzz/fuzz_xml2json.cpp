#include <XML2Json.h>

#include <cstdlib>

namespace {

// Every value of a rendering, through the list conversion the reply readers apply to it.
void walk(const QVariant& value)
{
    for (const QVariant& entry : XML2Json::transContentAsList(value)) {
        const QVariantMap map = entry.toMap();
        for (const QVariant& child : map)
            walk(child);
    }
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size)
{
    XML2Json converter;
    const QVariant parsed =
        converter.parse(QString::fromUtf8(reinterpret_cast<const char*>(data), qsizetype(size)));
    // A valid result is one map keyed by the document element, and only a failure explains itself.
    if (parsed.isValid() != converter.errorString().isEmpty() ||
        (parsed.isValid() && parsed.toMap().size() != 1))
        std::abort();
    walk(parsed);
    return 0;
}
