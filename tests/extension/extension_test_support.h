#pragma once

// The editor extension driven over a real socket pair, in this process: the test is the host.

#include "extension/extension_declaration.h"
#include "extension/extension_keys.h"
#include "extension/extension_view_controller.h"
#include "platform/extensionkit/extension_runtime.h"
#include "platform/extensionkit/frame_codec.h"
#include "tempstore/temp_store.h"
#include "tests/support/log_capture.h"
#include "tests/support/process_temp_directory.h"
#include "tests/support/media/fixture_movies.h"
#include "tests/support/temp_dir.h"

#include <QCoreApplication>
#include <QDir>
#include <QElapsedTimer>
#include <QJsonArray>
#include <QJsonDocument>
#include <QJsonObject>
#include <QTemporaryDir>
#include <gtest/gtest.h>

#include <memory>
#include <optional>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

namespace zaf::test {

// The host's end of the channel.
class HostEnd {
public:
    explicit HostEnd(int fd) : m_fd(fd) {}
    ~HostEnd() { closeChannel(); }

    void send(const QJsonObject &message)
    {
        const QByteArray frame = extensionkit::encodeFrame(QJsonDocument(message).toJson(QJsonDocument::Compact));
        ASSERT_EQ(::send(m_fd, frame.constData(), size_t(frame.size()), MSG_NOSIGNAL), frame.size());
    }
    void closeChannel()
    {
        if (m_fd >= 0)
            ::close(m_fd);
        m_fd = -1;
    }
    // The next message from the extension, handling the event loop while waiting (bounded).
    std::optional<QJsonObject> receive(int timeoutMs = 5000)
    {
        QElapsedTimer timer;
        timer.start();
        while (timer.elapsed() < timeoutMs) {
            if (std::optional<QByteArray> frame = m_decoder.takeFrame())
                return QJsonDocument::fromJson(*frame).object();
            QCoreApplication::processEvents(QEventLoop::AllEvents, 10);
            pollfd p{m_fd, POLLIN, 0};
            if (m_fd >= 0 && ::poll(&p, 1, 10) > 0 && (p.revents & POLLIN)) {
                char buffer[4096];
                const ssize_t n = ::read(m_fd, buffer, sizeof buffer);
                if (n > 0)
                    m_decoder.feed(buffer, n);
            }
        }
        return std::nullopt;
    }

private:
    int m_fd;
    extensionkit::FrameDecoder m_decoder;
};

struct Item {
    QString title;
    QString type;
    QJsonValue value;
};

inline QJsonObject beginRequest(const QList<Item> &items)
{
    QJsonArray inputItems;
    for (const Item &item : items) {
        QJsonObject attachment{{QStringLiteral("type"), item.type}, {QStringLiteral("value"), item.value}};
        inputItems.append(QJsonObject{{QStringLiteral("title"), item.title},
                                      {QStringLiteral("attachments"), QJsonArray{attachment}}});
    }
    return QJsonObject{{QStringLiteral("jsonrpc"), QStringLiteral("2.0")},
                       {QStringLiteral("id"), 1},
                       {QStringLiteral("method"), QStringLiteral("beginExtensionRequest")},
                       {QStringLiteral("params"), QJsonObject{{QStringLiteral("inputItems"), inputItems}}}};
}

inline QJsonObject removeView()
{
    return QJsonObject{{QStringLiteral("jsonrpc"), QStringLiteral("2.0")},
                       {QStringLiteral("method"), QStringLiteral("removeExtensionView")}};
}

inline Item text(const char *key, const QString &value)
{
    return Item{QString::fromLatin1(key), QStringLiteral("text/plain"), value};
}

class ExtensionTest : public ::testing::Test {
protected:
    void SetUp() override
    {
        usePrivateTempDirectoryForProcess();
        fixture::FixtureSpec spec;
        spec.seconds = 1;
        moviePath = makeFixtureMovie(scratch.path(), spec);
        int fds[2];
        ASSERT_EQ(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, fds), 0);
        host = std::make_unique<HostEnd>(fds[0]);
        extensionkit::ExtensionDeclaration declaration = ZafVideoEditorExtensionDeclaration();
        declaration.prepareProcess = {}; // the process-wide preparation happened above
        runtime = std::make_unique<extensionkit::ExtensionRuntime>(fds[1], declaration);
        QObject::connect(runtime.get(), &extensionkit::ExtensionRuntime::finished, [this] { finished = true; });
        ASSERT_TRUE(runtime->start());
    }
    void TearDown() override
    {
        runtime.reset();
        host.reset();
    }

    QList<Item> requiredItems() const
    {
        return {text(ZafVideoEditorExtensionMoviePathKey, moviePath), text(ZafVideoEditorExtensionAppNameKey, QStringLiteral("Recorder")),
                text(ZafVideoEditorExtensionBundleIdentifierKey, QStringLiteral("org.example.Recorder"))};
    }
    ZafVideoEditorExtensionViewController *principal() const
    {
        return qobject_cast<ZafVideoEditorExtensionViewController *>(runtime->principal());
    }
    // Sends the request and handles events until the extension has answered and its item loads have
    // ended (the editor is then built when the required items were there).
    void beginWith(const QList<Item> &items)
    {
        host->send(beginRequest(items));
        const std::optional<QJsonObject> answer = host->receive();
        ASSERT_TRUE(answer.has_value());
        EXPECT_EQ(answer->value(QStringLiteral("result")).toObject().value(QStringLiteral("accepted")).toBool(), true);
        settle(300);
    }
    void settle(int ms)
    {
        QElapsedTimer timer;
        timer.start();
        while (timer.elapsed() < ms)
            QCoreApplication::processEvents(QEventLoop::AllEvents, 10);
    }
    bool waitFinished(int ms = 5000)
    {
        QElapsedTimer timer;
        timer.start();
        while (!finished && timer.elapsed() < ms)
            QCoreApplication::processEvents(QEventLoop::AllEvents, 10);
        return finished;
    }
    static QStringList tempEntries()
    {
        return QDir(ZafTempStore::defaultStore()._srTempPath()).entryList(QDir::AllEntries | QDir::Hidden | QDir::NoDotAndDotDot);
    }

    ScratchDir scratch;
    QString moviePath;
    std::unique_ptr<HostEnd> host;
    std::unique_ptr<extensionkit::ExtensionRuntime> runtime;
    bool finished = false;
};

// The activity types of an extensionDidFinishWithActivityTypes notification, or nullopt.
inline std::optional<QStringList> reportedTypes(const std::optional<QJsonObject> &message)
{
    if (!message || message->value(QStringLiteral("method")).toString() != QLatin1String("extensionDidFinishWithActivityTypes")
        || message->contains(QStringLiteral("id")))
        return std::nullopt;
    const QJsonArray params = message->value(QStringLiteral("params")).toArray();
    if (params.size() != 1 || !params.first().isArray())
        return std::nullopt;
    QStringList types;
    for (const QJsonValue &v : params.first().toArray())
        types << v.toString();
    return types;
}

} // namespace zaf::test
