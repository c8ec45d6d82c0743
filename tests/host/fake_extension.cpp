// zaf-fake-extension: the extension's end of the host channel, driven by a script of steps, for
// testing the host side against a real process over a real socket pair.
//
//   zaf-fake-extension STEP...    (steps from $ZAF_FAKE_STEPS, split at spaces, when argv has none)
//
// Steps, run in order (the process exits 0 after the last one):
//   accept            read beginExtensionRequest, answer {"accepted": true}
//   reject            read beginExtensionRequest, answer with a JSON-RPC error
//   report A,B,...    send extensionDidFinishWithActivityTypes with these types ("report -": none)
//   report-slowly A   the same, written one byte at a time
//   report-big N      a report of N activity types of 100 characters each
//   garbage           a frame whose payload is not JSON
//   bad-params        an extensionDidFinishWithActivityTypes whose params are not an array of arrays
//   oversized         a length prefix of 1 MiB + 1 followed by a few bytes
//   partial           a length prefix of 100 followed by 10 bytes, then the channel is closed
//   call-unknown      a request (id 7) for a method the host does not have
//   expect-error      read one message; exit 4 unless it is a JSON-RPC error answer with id 7
//   await-remove      read until removeExtensionView (then exit 0); exit 3 at end of channel
//   await-eof         read until the end of the channel, then exit 0
//   close             close the channel
//   hang              sleep until killed
//   ignore-term       ignore SIGTERM from now on
//   crash             abort() (without a core file)
//   exit N            exit with status N
// With $ZAF_FAKE_DUMP set to a path, the fake writes there, once the request has been read, a JSON
// object with the request, the channel variable, a marker variable, whether descriptor 3 is a
// socket and whether SIGPIPE was at its default action.

#include "platform/extensionkit/frame_codec.h"

#include <QByteArray>
#include <QFile>
#include <QJsonArray>
#include <QJsonDocument>
#include <QJsonObject>
#include <QString>
#include <QStringList>

#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <optional>

#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

int g_fd = 3;
// Whether SIGPIPE was at its default action when the process started (before it ignores it).
bool g_sigpipeDefaultAtStart = false;

void die(const char *why, int status)
{
    std::fprintf(stderr, "zaf-fake-extension: %s\n", why);
    std::_Exit(status);
}

void writeAll(const QByteArray &bytes)
{
    qsizetype done = 0;
    while (done < bytes.size()) {
        const ssize_t n = ::send(g_fd, bytes.constData() + done, bytes.size() - done, MSG_NOSIGNAL);
        if (n < 0 && errno == EINTR)
            continue;
        if (n <= 0)
            die("cannot write to the host", 6);
        done += n;
    }
}

void sendJson(const QJsonObject &object)
{
    writeAll(zaf::extensionkit::encodeFrame(QJsonDocument(object).toJson(QJsonDocument::Compact)));
}

zaf::extensionkit::FrameDecoder g_decoder;

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

QJsonObject readRequest()
{
    const std::optional<QJsonObject> request = readMessage();
    if (!request || request->value(QStringLiteral("method")).toString() != QLatin1String("beginExtensionRequest")
        || !request->contains(QStringLiteral("id")))
        die("expected beginExtensionRequest", 8);
    return *request;
}

void dump(const QString &path, const QJsonObject &request)
{
    struct stat info {};
    const bool fd3IsSocket = ::fstat(3, &info) == 0 && S_ISSOCK(info.st_mode);
    const QJsonObject out{{QStringLiteral("request"), request},
                          {QStringLiteral("channelVariable"), qEnvironmentVariable("ZAF_EXTENSION_CHANNEL_FD")},
                          {QStringLiteral("marker"), qEnvironmentVariable("ZAF_FAKE_MARKER")},
                          {QStringLiteral("fd3IsSocket"), fd3IsSocket},
                          {QStringLiteral("sigpipeDefault"), g_sigpipeDefaultAtStart}};
    FILE *file = std::fopen(QFile::encodeName(path).constData(), "w");
    if (!file)
        die("cannot write the dump", 9);
    const QByteArray bytes = QJsonDocument(out).toJson();
    std::fwrite(bytes.constData(), 1, bytes.size(), file);
    std::fclose(file);
}

void report(const QStringList &types)
{
    sendJson(QJsonObject{{QStringLiteral("jsonrpc"), QStringLiteral("2.0")},
                         {QStringLiteral("method"), QStringLiteral("extensionDidFinishWithActivityTypes")},
                         {QStringLiteral("params"), QJsonArray{QJsonArray::fromStringList(types)}}});
}

QByteArray lengthPrefix(quint32 length)
{
    QByteArray bytes(4, Qt::Uninitialized);
    for (int i = 0; i < 4; ++i)
        bytes[i] = char((length >> (8 * i)) & 0xff);
    return bytes;
}

} // namespace

int main(int argc, char **argv)
{
    struct sigaction atStart {};
    ::sigaction(SIGPIPE, nullptr, &atStart);
    g_sigpipeDefaultAtStart = atStart.sa_handler == SIG_DFL;
    // Writes to a host that has gone fail with EPIPE rather than killing this process.
    std::signal(SIGPIPE, SIG_IGN);
    QStringList args;
    for (int i = 1; i < argc; ++i)
        args << QString::fromLocal8Bit(argv[i]);
    const QString dumpPath = qEnvironmentVariable("ZAF_FAKE_DUMP");
    if (args.isEmpty())
        args = qEnvironmentVariable("ZAF_FAKE_STEPS").split(QLatin1Char(' '), Qt::SkipEmptyParts);

    for (int i = 0; i < args.size(); ++i) {
        const QString &step = args[i];
        auto argument = [&]() {
            if (i + 1 >= args.size())
                die("a step lacks its argument", 2);
            return args[++i];
        };
        if (step == QLatin1String("accept") || step == QLatin1String("reject")) {
            const QJsonObject request = readRequest();
            if (!dumpPath.isEmpty())
                dump(dumpPath, request);
            QJsonObject answer{{QStringLiteral("jsonrpc"), QStringLiteral("2.0")}, {QStringLiteral("id"), request.value(QStringLiteral("id"))}};
            if (step == QLatin1String("accept"))
                answer.insert(QStringLiteral("result"), QJsonObject{{QStringLiteral("accepted"), true}});
            else
                answer.insert(QStringLiteral("error"), QJsonObject{{QStringLiteral("code"), -32602}, {QStringLiteral("message"), QStringLiteral("no movie")}});
            sendJson(answer);
        } else if (step == QLatin1String("report")) {
            const QString types = argument();
            report(types == QLatin1String("-") ? QStringList{} : types.split(QLatin1Char(',')));
        } else if (step == QLatin1String("report-slowly")) {
            const QString type = argument();
            const QByteArray frame = zaf::extensionkit::encodeFrame(
                QJsonDocument(QJsonObject{{QStringLiteral("jsonrpc"), QStringLiteral("2.0")},
                                          {QStringLiteral("method"), QStringLiteral("extensionDidFinishWithActivityTypes")},
                                          {QStringLiteral("params"), QJsonArray{QJsonArray{type}}}})
                    .toJson(QJsonDocument::Compact));
            for (char byte : frame) {
                writeAll(QByteArray(1, byte));
                ::usleep(2000);
            }
        } else if (step == QLatin1String("report-big")) {
            const int count = argument().toInt();
            QStringList types;
            for (int n = 0; n < count; ++n)
                types << QStringLiteral("%1").arg(n, 100, 10, QLatin1Char('0'));
            report(types);
        } else if (step == QLatin1String("garbage")) {
            writeAll(zaf::extensionkit::encodeFrame("this is not JSON {"));
        } else if (step == QLatin1String("bad-params")) {
            sendJson(QJsonObject{{QStringLiteral("jsonrpc"), QStringLiteral("2.0")},
                                 {QStringLiteral("method"), QStringLiteral("extensionDidFinishWithActivityTypes")},
                                 {QStringLiteral("params"), QJsonArray{QStringLiteral("not an array")}}});
        } else if (step == QLatin1String("oversized")) {
            writeAll(lengthPrefix(1024 * 1024 + 1) + QByteArray(64, 'x'));
        } else if (step == QLatin1String("partial")) {
            writeAll(lengthPrefix(100) + QByteArray(10, '{'));
            ::close(g_fd);
            g_fd = -1;
        } else if (step == QLatin1String("call-unknown")) {
            sendJson(QJsonObject{{QStringLiteral("jsonrpc"), QStringLiteral("2.0")}, {QStringLiteral("id"), 7},
                                 {QStringLiteral("method"), QStringLiteral("openTheDoor")}});
        } else if (step == QLatin1String("expect-error")) {
            const std::optional<QJsonObject> answer = readMessage();
            if (!answer || answer->value(QStringLiteral("id")).toInt() != 7 || !answer->value(QStringLiteral("error")).isObject())
                die("expected an error answer with id 7", 4);
        } else if (step == QLatin1String("await-remove")) {
            for (;;) {
                const std::optional<QJsonObject> message = readMessage();
                if (!message)
                    die("the channel ended before removeExtensionView", 3);
                if (message->value(QStringLiteral("method")).toString() == QLatin1String("removeExtensionView")) {
                    if (message->contains(QStringLiteral("id")))
                        die("removeExtensionView came as a request", 10);
                    return 0;
                }
            }
        } else if (step == QLatin1String("await-eof")) {
            while (readMessage()) {
            }
        } else if (step == QLatin1String("close")) {
            ::close(g_fd);
            g_fd = -1;
        } else if (step == QLatin1String("hang")) {
            for (;;)
                ::pause();
        } else if (step == QLatin1String("ignore-term")) {
            std::signal(SIGTERM, SIG_IGN);
        } else if (step == QLatin1String("crash")) {
            const rlimit noCore{0, 0};
            ::setrlimit(RLIMIT_CORE, &noCore);
            std::abort();
        } else if (step == QLatin1String("exit")) {
            return argument().toInt();
        } else {
            die("unknown step", 2);
        }
    }
    return 0;
}
