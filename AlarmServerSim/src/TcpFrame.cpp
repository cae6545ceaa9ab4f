#include "TcpFrame.h"

#include <QJsonDocument>
#include <QJsonParseError>
#include <QtEndian>

namespace AlarmServerSim {

namespace {

constexpr qsizetype kHeaderSize = sizeof(quint32);

} // namespace

QByteArray encodeFrame(const QJsonObject& payload)
{
    const QByteArray json = QJsonDocument(payload).toJson(QJsonDocument::Compact);
    QByteArray frame(kHeaderSize, Qt::Uninitialized);
    qToBigEndian(quint32(json.size()), frame.data());
    return frame + json;
}

bool takeFrames(QByteArray& buffer, QList<QJsonObject>& out, QString* error)
{
    qsizetype offset = 0;
    bool valid = true;
    const auto fail = [&](const QString& message) {
        if (error)
            *error = message;
        valid = false;
    };
    while (buffer.size() - offset >= kHeaderSize) {
        const auto length = qFromBigEndian<quint32>(buffer.constData() + offset);
        if (length > kMaxFramePayload) {
            fail(QStringLiteral("frame of %1 bytes exceeds the limit").arg(length));
            break;
        }
        if (buffer.size() - offset - kHeaderSize < qsizetype(length))
            break;
        QJsonParseError parseError;
        const QJsonDocument document = QJsonDocument::fromJson(
            QByteArray::fromRawData(buffer.constData() + offset + kHeaderSize, length),
            &parseError);
        if (!document.isObject()) {
            fail(parseError.error != QJsonParseError::NoError
                     ? parseError.errorString()
                     : QStringLiteral("frame payload is not a JSON object"));
            break;
        }
        out.append(document.object());
        offset += kHeaderSize + length;
    }
    buffer.remove(0, offset);
    return valid;
}

} // namespace AlarmServerSim
