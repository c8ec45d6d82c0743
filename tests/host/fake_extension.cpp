// zaf-fake-extension: the extension's end of the host channel, driven by a script of steps, for
// testing the host side against a real process over a real socket pair. The steps come from
// $ZAF_FAKE_STEPS, split at spaces (the host passes no arguments); it exits 0 after the last one.
//
//   take              read beginExtensionRequest and leave it unanswered
//   accept / reject   take, then answer {"accepted": true} / a JSON-RPC error
//   report A,B,...    send extensionDidFinishWithActivityTypes with these types ("-": none)
//   report-big N      a report of N activity types of 100 characters each
//   send PAYLOAD      a frame carrying PAYLOAD as it is (JSON or not)
//   oversized         a length prefix of 1 MiB + 1 followed by a few bytes
//   expect-error      read one message; exit 4 unless it is a JSON-RPC error answer with id 7
//   await-remove      read until the removeExtensionView notification (exit 0); exit 3 at end of channel
//   await-eof         read until the end of the channel
//   close / hang / crash / exit N
// With $ZAF_FAKE_DUMP set, the request, the channel variable and whether descriptor 3 is a socket
// are written there as JSON.

#include "platform/extensionkit/frame_codec.h"

#include <QFile>
#include <QJsonArray>
#include <QJsonDocument>
#include <QJsonObject>
#include <QStringList>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <optional>
#include <utility>

#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

int g_fd = 3;
zaf::extensionkit::FrameDecoder g_decoder;

[[noreturn]] void die(const char *why, int status)
{
    std::fprintf(stderr, "zaf-fake-extension: %s\n", why);
    std::_Exit(status);
}

void writeAll(const QByteArray &bytes)
{
    for (qsizetype done = 0; done < bytes.size();) {
        const ssize_t n = ::send(g_fd, bytes.constData() + done, bytes.size() - done, MSG_NOSIGNAL);
        if (n < 0 && errno == EINTR)
            continue;
        // A host that closed the channel drops whatever follows; the next read sees the end.
        if (n < 0 && (errno == EPIPE || errno == ECONNRESET))
            return;
        if (n <= 0)
            die("cannot write to the host", 6);
        done += n;
    }
}

QByteArray frame(QJsonObject message)
{
    message.insert("jsonrpc", "2.0");
    return zaf::extensionkit::encodeFrame(QJsonDocument(message).toJson(QJsonDocument::Compact));
}

QByteArray report(const QStringList &types)
{
    return frame({{"method", "extensionDidFinishWithActivityTypes"}, {"params", QJsonArray{QJsonArray::fromStringList(types)}}});
}

// The next message from the host, or nullopt at the end of the channel.
std::optional<QJsonObject> readMessage()
{
    while (!g_decoder.hasFrame()) {
        char buffer[4096];
        const ssize_t n = ::read(g_fd, buffer, sizeof buffer);
        if (n < 0 && errno == EINTR)
            continue;
        if (n <= 0)
            return std::nullopt;
        if (!g_decoder.feed(buffer, n))
            die("the host sent a bad frame", 7);
    }
    const QJsonDocument document = QJsonDocument::fromJson(*g_decoder.takeFrame());
    if (!document.isObject())
        die("the host sent a message that is not a JSON object", 7);
    return document.object();
}

void dump(const QString &path, const QJsonObject &request)
{
    struct stat info {};
    const QJsonObject out{{"request", request},
                          {"channelVariable", qEnvironmentVariable("ZAF_EXTENSION_CHANNEL_FD")},
                          {"fd3IsSocket", ::fstat(3, &info) == 0 && S_ISSOCK(info.st_mode)}};
    QFile file(path);
    if (!file.open(QIODevice::WriteOnly) || file.write(QJsonDocument(out).toJson()) < 0)
        die("cannot write the dump", 9);
}

} // namespace

int main()
{
    const QStringList args = qEnvironmentVariable("ZAF_FAKE_STEPS").split(' ', Qt::SkipEmptyParts);
    for (int i = 0; i < args.size(); ++i) {
        const QString &step = args[i];
        auto argument = [&] {
            if (i + 1 >= args.size())
                die("a step lacks its argument", 2);
            return args[++i];
        };
        if (step == "take" || step == "accept" || step == "reject") {
            const std::optional<QJsonObject> request = readMessage();
            if (!request || request->value("method") != "beginExtensionRequest" || !request->contains("id"))
                die("expected beginExtensionRequest", 8);
            if (!qEnvironmentVariableIsEmpty("ZAF_FAKE_DUMP"))
                dump(qEnvironmentVariable("ZAF_FAKE_DUMP"), *request);
            if (step == "take")
                continue;
            if (step == "accept")
                writeAll(frame({{"id", request->value("id")}, {"result", QJsonObject{{"accepted", true}}}}));
            else
                writeAll(frame({{"id", request->value("id")}, {"error", QJsonObject{{"code", -32602}, {"message", "no movie"}}}}));
        } else if (step == "report") {
            const QString types = argument();
            writeAll(report(types == "-" ? QStringList{} : types.split(',')));
        } else if (step == "report-big") {
            QStringList types;
            for (int n = 0, count = argument().toInt(); n < count; ++n)
                types << QString("%1").arg(n, 100, 10, QLatin1Char('0'));
            writeAll(report(types));
        } else if (step == "send") {
            writeAll(zaf::extensionkit::encodeFrame(argument().toUtf8()));
        } else if (step == "oversized") {
            writeAll(zaf::extensionkit::encodeFrame(QByteArray(1024 * 1024 + 1, 'x')).left(68));
        } else if (step == "close") {
            ::close(std::exchange(g_fd, -1));
        } else if (step == "expect-error") {
            const std::optional<QJsonObject> answer = readMessage();
            if (!answer || answer->value("id").toInt() != 7 || !answer->value("error").isObject())
                die("expected an error answer with id 7", 4);
        } else if (step == "await-remove") {
            while (const std::optional<QJsonObject> message = readMessage()) {
                if (message->value("method") == "removeExtensionView")
                    return message->contains("id") ? 10 : 0;
            }
            die("the channel ended before removeExtensionView", 3);
        } else if (step == "await-eof") {
            while (readMessage()) {
            }
        } else if (step == "hang") {
            for (;;)
                ::pause();
        } else if (step == "crash") {
            const rlimit noCore{0, 0};
            ::setrlimit(RLIMIT_CORE, &noCore);
            std::abort();
        } else if (step == "exit") {
            return argument().toInt();
        } else {
            die("unknown step", 2);
        }
    }
    return 0;
}
