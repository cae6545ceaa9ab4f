// Load on a running `alarmsearch serve`: searches per second and their latency at 1, 8 and 32
// concurrent clients for 100-alarm and 5000-alarm pages, the delay from an update's answer to
// its event at many open WebSocket subscribers, and the server's resident memory per idle
// subscriber. Prints each figure with its target.
//
//   alarmsearch-serve-load URL SERVER_PID [--seconds S] [--subscribers N]
#include <QCoreApplication>
#include <QElapsedTimer>
#include <QEventLoop>
#include <QFile>
#include <QJsonArray>
#include <QJsonDocument>
#include <QJsonObject>
#include <QNetworkAccessManager>
#include <QNetworkReply>
#include <QTimer>
#include <QWebSocket>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <memory>

#include <unistd.h>

namespace {

QUrl g_base;

QUrl endpoint(const QString& path)
{
    QUrl url = g_base;
    url.setPath(path);
    return url;
}

QNetworkRequest jsonRequest(const QString& path)
{
    QNetworkRequest request(endpoint(path));
    request.setHeader(QNetworkRequest::ContentTypeHeader, QByteArrayLiteral("application/json"));
    return request;
}

QByteArray post(QNetworkAccessManager& network, const QString& path, const QJsonObject& body)
{
    QNetworkReply* reply =
        network.post(jsonRequest(path), QJsonDocument(body).toJson(QJsonDocument::Compact));
    QEventLoop loop;
    QObject::connect(reply, &QNetworkReply::finished, &loop, &QEventLoop::quit);
    loop.exec();
    QByteArray bytes = reply->readAll();
    reply->deleteLater();
    return bytes;
}

double percentile(QList<double> values, double p)
{
    if (values.isEmpty())
        return 0;
    std::sort(values.begin(), values.end());
    return values[qMin(values.size() - 1, qsizetype(p * double(values.size())))];
}

qint64 residentKiB(qint64 pid)
{
    QFile status(QStringLiteral("/proc/%1/status").arg(pid));
    if (!status.open(QIODevice::ReadOnly))
        return 0;
    for (const QByteArray& line : status.readAll().split('\n')) {
        if (line.startsWith("VmRSS:"))
            return line.mid(6).trimmed().split(' ').value(0).toLongLong();
    }
    return 0;
}

// User plus system CPU time the process has used, in seconds.
double cpuSeconds(qint64 pid)
{
    QFile stat(QStringLiteral("/proc/%1/stat").arg(pid));
    if (!stat.open(QIODevice::ReadOnly))
        return 0;
    const QByteArray text = stat.readAll();
    // Fields after the command name, which is in parentheses: utime and stime are the 12th and
    // 13th of them.
    const QList<QByteArray> fields = text.mid(text.lastIndexOf(')') + 2).split(' ');
    return double(fields.value(11).toLongLong() + fields.value(12).toLongLong()) /
           double(sysconf(_SC_CLK_TCK));
}

void wait(int ms)
{
    QEventLoop loop;
    QTimer::singleShot(ms, &loop, &QEventLoop::quit);
    loop.exec();
}

struct Throughput
{
    double perSecond = 0;
    double p50 = 0;
    double p99 = 0;
    double serverCpuMs = 0; // per search
    double serverCores = 0; // CPU time over wall time: how many cores the server kept busy
    double clientCores = 0; // the same for this client
};

// clients connections, each asking again as soon as its answer is in, for seconds.
Throughput searchLoad(qint64 serverPid, int clients, const QJsonObject& body, double seconds)
{
    const double cpuBefore = cpuSeconds(serverPid);
    const double clientBefore = cpuSeconds(QCoreApplication::applicationPid());
    const QByteArray bytes = QJsonDocument(body).toJson(QJsonDocument::Compact);
    QList<double> latencies;
    std::vector<std::unique_ptr<QNetworkAccessManager>> networks;
    QElapsedTimer clock;
    clock.start();
    const auto endMs = qint64(seconds * 1000);
    QEventLoop loop;
    int running = clients;
    std::function<void(QNetworkAccessManager*)> ask = [&](QNetworkAccessManager* network) {
        const qint64 started = clock.nsecsElapsed();
        QNetworkReply* reply =
            network->post(jsonRequest(QStringLiteral("/api/v1/alarms/search")), bytes);
        QObject::connect(reply, &QNetworkReply::finished, reply, [&, reply, network, started] {
            reply->readAll();
            reply->deleteLater();
            if (reply->error() == QNetworkReply::NoError)
                latencies.append(double(clock.nsecsElapsed() - started) / 1e6);
            if (clock.elapsed() < endMs)
                ask(network);
            else if (--running == 0)
                loop.quit();
        });
    };
    for (int i = 0; i < clients; ++i) {
        networks.push_back(std::make_unique<QNetworkAccessManager>());
        ask(networks.back().get());
    }
    loop.exec();
    const double count = double(qMax<qsizetype>(1, latencies.size()));
    return Throughput{double(latencies.size()) / (double(clock.elapsed()) / 1000.0),
                      percentile(latencies, 0.5),
                      percentile(latencies, 0.99),
                      (cpuSeconds(serverPid) - cpuBefore) * 1000.0 / count,
                      (cpuSeconds(serverPid) - cpuBefore) / (double(clock.elapsed()) / 1000.0),
                      (cpuSeconds(QCoreApplication::applicationPid()) - clientBefore) /
                          (double(clock.elapsed()) / 1000.0)};
}

} // namespace

int main(int argc, char* argv[])
{
    QCoreApplication app(argc, argv);
    const QStringList args = app.arguments();
    if (args.size() < 3) {
        std::fprintf(stderr, "usage: %s URL SERVER_PID [--seconds S] [--subscribers N]\n", argv[0]);
        return 2;
    }
    g_base = QUrl(args[1]);
    const qint64 serverPid = args[2].toLongLong();
    const double seconds =
        args.contains(QStringLiteral("--seconds"))
            ? args.value(args.indexOf(QStringLiteral("--seconds")) + 1).toDouble()
            : 5.0;
    const int subscriberCount =
        args.contains(QStringLiteral("--subscribers"))
            ? args.value(args.indexOf(QStringLiteral("--subscribers")) + 1).toInt()
            : 1000;

    double load[3] = {0, 0, 0};
    if (getloadavg(load, 3) > 0)
        std::printf("machine load average before the run: %.1f (on %d cores)\n", load[0],
                    int(sysconf(_SC_NPROCESSORS_ONLN)));

    // A window of about 100 alarms: the newest hundred of the newest full page.
    QNetworkAccessManager network;
    const QJsonArray newest =
        QJsonDocument::fromJson(post(network, QStringLiteral("/api/v1/alarms/search"), {}))
            .object()
            .value(QLatin1String("alarms"))
            .toArray();
    if (newest.size() < 5000) {
        std::fprintf(stderr, "the server has %d alarms, fewer than 5000\n", int(newest.size()));
        return 1;
    }
    const auto timeOf = [&](int i) {
        return newest[i].toObject().value(QLatin1String("ServerTime")).toString();
    };
    const QList<QPair<QString, QJsonObject>> pages{
        {QStringLiteral("100-alarm"), QJsonObject{{"from", timeOf(99)}, {"to", timeOf(0)}}},
        {QStringLiteral("5000-alarm"), QJsonObject()},
    };
    for (const auto& [name, body] : pages) {
        double single = 0;
        for (const int clients : {1, 8, 32}) {
            const Throughput t = searchLoad(serverPid, clients, body, seconds);
            if (clients == 1)
                single = t.perSecond;
            std::printf("searches per second, %s pages, %2d clients: %.1f (p50 %.1f ms, p99 %.1f "
                        "ms; server CPU %.1f ms per search, %.2f cores busy; client %.2f cores)\n",
                        qPrintable(name), clients, t.perSecond, t.p50, t.p99, t.serverCpuMs,
                        t.serverCores, t.clientCores);
            if (clients == 32)
                std::printf("throughput 32 clients / 1 client, %s pages: %.2fx (target >= 1.6x)\n",
                            qPrintable(name), single > 0 ? t.perSecond / single : 0.0);
            std::fflush(stdout);
        }
    }

    // Subscribers: opened, confirmed, then left idle.
    const qint64 rssBefore = residentKiB(serverPid);
    std::vector<std::unique_ptr<QWebSocket>> sockets;
    QHash<QString, QList<qint64>> arrivals; // event arrival times by relay path
    int confirmed = 0;
    QElapsedTimer clock;
    clock.start();
    QUrl wsUrl = endpoint(QStringLiteral("/api/v1/events"));
    wsUrl.setScheme(QStringLiteral("ws"));
    for (int i = 0; i < subscriberCount; ++i) {
        auto socket = std::make_unique<QWebSocket>();
        QWebSocket* raw = socket.get();
        QObject::connect(raw, &QWebSocket::connected, raw,
                         [raw] { raw->sendTextMessage(QStringLiteral("{\"type\":\"hello\"}")); });
        QObject::connect(raw, &QWebSocket::textMessageReceived, raw, [&](const QString& text) {
            const qint64 now = clock.nsecsElapsed();
            const QJsonObject message = QJsonDocument::fromJson(text.toUtf8()).object();
            if (message.value(QLatin1String("type")).toString() == QLatin1String("subscribed"))
                ++confirmed;
            else
                arrivals[message.value(QLatin1String("data"))
                             .toObject()
                             .value(QLatin1String("relayPath"))
                             .toString()]
                    .append(now);
        });
        raw->open(wsUrl);
        sockets.push_back(std::move(socket));
        if (i % 100 == 99)
            wait(50);
    }
    for (int i = 0; i < 600 && confirmed < subscriberCount; ++i)
        wait(100);
    wait(2000);
    const qint64 rssAfter = residentKiB(serverPid);
    std::printf("subscribers confirmed: %d of %d\n", confirmed, subscriberCount);
    std::printf("resident memory per idle subscriber: %.1f KiB (target < 64 KiB)\n",
                confirmed ? double(rssAfter - rssBefore) / confirmed : 0.0);

    // Updates one after another; each event's delay is counted from the update's answer (it is
    // published before the answer, so it may come first: negative) and from the request.
    QList<double> delays;
    QList<double> fromRequest;
    const int updates = 30;
    for (int i = 0; i < updates; ++i) {
        const QString id = newest[i].toObject().value(QLatin1String("AlarmID")).toString();
        const qint64 sent = clock.nsecsElapsed();
        const QByteArray answer =
            post(network, QStringLiteral("/api/v1/alarms/update"),
                 {{"ids", QJsonArray{id}}, {"state", i % 2 ? "Handled" : "Processing"}});
        const qint64 answered = clock.nsecsElapsed();
        const QString relayPath =
            QJsonDocument::fromJson(answer).object().value(QLatin1String("relayPath")).toString();
        for (int w = 0; w < 100 && arrivals.value(relayPath).size() < confirmed; ++w)
            wait(20);
        for (const qint64 at : arrivals.value(relayPath)) {
            delays.append(double(at - answered) / 1e6);
            fromRequest.append(double(at - sent) / 1e6);
        }
        std::fflush(stdout);
    }
    std::printf("events received: %lld of %lld\n", qint64(delays.size()),
                qint64(updates) * confirmed);
    std::printf("event delay after the update's answer at %d subscribers: p50 %.1f ms, p99 %.1f ms "
                "(target p99 < 100 ms)\n",
                confirmed, percentile(delays, 0.5), percentile(delays, 0.99));
    std::printf("event delay after the update's request at %d subscribers: p50 %.1f ms, p99 %.1f "
                "ms\n",
                confirmed, percentile(fromRequest, 0.5), percentile(fromRequest, 0.99));
    return 0;
}
