// The framed socket over a real socket pair. SIGPIPE stays at its default here: a write to a closed
// peer that raised it would kill this test program.

#include "platform/extensionkit/framed_socket.h"
#include "tests/platform/extensionkit/socket_pair.h"
#include "tests/support/named_cases.h"

#include <QJsonArray>
#include <QJsonDocument>

#include <gtest/gtest.h>

#include <atomic>
#include <cerrno>
#include <csignal>
#include <thread>

#include <fcntl.h>
#include <sys/socket.h>
#include <unistd.h>

using zaf::extensionkit::encodeFrame;
using zaf::extensionkit::FramedSocket;
using zaf::test::caseName;
using zaf::test::SocketPair;
using zaf::test::waitUntil;

ZAF_PRINT_CASES_AS_NAMES

namespace {

// A started socket on the extension's end of a socket pair, recording every signal.
struct Harness {
    explicit Harness(FramedSocket::FullBuffer fullBuffer = FramedSocket::FullBuffer::Wait)
        : socket(zaf::UniqueFd(pair.releaseExtensionFd()), 1024 * 1024, fullBuffer, "the host")
    {
        EXPECT_EQ(std::signal(SIGPIPE, SIG_DFL), SIG_DFL) << "this program must run with SIGPIPE at its default";
        QObject::connect(&socket, &FramedSocket::frameReceived, [this](const QByteArray &payload) { frames.append(payload); });
        QObject::connect(&socket, &FramedSocket::protocolError, [this](const QString &text) { protocolErrors.append(text); });
        QObject::connect(&socket, &FramedSocket::closed, [this](const QString &reason) { closes.append(reason); });
        QObject::connect(&socket, &FramedSocket::writeFailed, [this](const zaf::Error &error) { writeFailures.append(error.code); });
        EXPECT_TRUE(socket.start());
    }
    // Sends `count` messages of about 60 KB, numbered, and returns the failures.
    int sendNumbered(int count, int first = 0)
    {
        int failures = 0;
        for (int i = first; i < first + count; ++i)
            failures += socket.sendFrame(QJsonDocument(QJsonObject{{"n", i}, {"fill", QString(60000, 'f')}}).toJson()).has_value();
        return failures;
    }

    SocketPair pair;
    FramedSocket socket;
    QList<QByteArray> frames;
    QStringList protocolErrors;
    QStringList closes;
    QList<int> writeFailures;
};

} // namespace

TEST(FramedSocket, FramesSplitAcrossReadsArriveWholeInOrder)
{
    Harness h;
    // Two frames in one write, a third of 100 KB (two reads) split across two writes.
    const QByteArray stream = encodeFrame("a") + encodeFrame(QByteArray()) + encodeFrame(QByteArray(100000, 'c'));
    h.pair.writeRaw(stream.left(stream.size() - 3));
    h.pair.writeRaw(stream.right(3));
    ASSERT_TRUE(waitUntil([&] { return h.frames.size() == 3; }, 5000));
    EXPECT_EQ(h.frames, (QList<QByteArray>{"a", QByteArray(), QByteArray(100000, 'c')}));
    EXPECT_TRUE(h.protocolErrors.isEmpty());
}

struct BadFrame { const char *name; QByteArray tail; bool peerCloses; const char *error; };

class FramedSocketBadFrameTest : public ::testing::TestWithParam<BadFrame> {};

TEST_P(FramedSocketBadFrameTest, IsOneProtocolErrorAfterTheFramesBeforeItThenCloses)
{
    Harness h;
    h.pair.writeRaw(encodeFrame("before") + GetParam().tail);
    if (GetParam().peerCloses)
        h.pair.closeHost();
    ASSERT_TRUE(waitUntil([&] { return !h.closes.isEmpty(); }, 5000));
    EXPECT_EQ(h.frames, QList<QByteArray>{"before"});
    ASSERT_EQ(h.protocolErrors.size(), 1);
    EXPECT_TRUE(h.protocolErrors[0].contains(GetParam().error)) << h.protocolErrors[0].toStdString();
    EXPECT_FALSE(h.socket.isOpen());
}

INSTANTIATE_TEST_SUITE_P(Frames, FramedSocketBadFrameTest, ::testing::Values(
    BadFrame{"CutOffByTheEnd", encodeFrame("cut").left(5), true, "inside a frame (5 bytes"},
    BadFrame{"LengthAboveTheCap", QByteArray::fromHex("01001000") + QByteArray(64, 'x'), false, "1048577"}), caseName);

TEST(FramedSocket, PeerClosingClosesOnceNamingThePeer)
{
    Harness h;
    h.pair.closeHost();
    ASSERT_TRUE(waitUntil([&] { return !h.closes.isEmpty(); }, 5000));
    h.socket.close("again");
    EXPECT_EQ(h.closes, QStringList{"the host closed the connection"});
}

TEST(FramedSocket, WriteToAGonePeerFailsWithoutSigpipe)
{
    // Before the socket has read the end of stream the write itself fails; afterwards it is closed.
    Harness h;
    h.pair.closeHost();
    zaf::OptionalError error = h.socket.sendFrame("afterPeerClosed");
    ASSERT_TRUE(error.has_value());
    EXPECT_TRUE(error->code == EPIPE || error->code == ECONNRESET) << error->code;
    ASSERT_TRUE(waitUntil([&] { return !h.closes.isEmpty(); }, 5000));
    error = h.socket.sendFrame("late");
    ASSERT_TRUE(error.has_value());
    EXPECT_EQ(error->domain, "posix");
    EXPECT_EQ(error->code, EPIPE);
}

TEST(FramedSocket, ConcurrentSendersNeverInterleaveFrames)
{
    constexpr int kThreads = 4, kPerThread = 50;
    Harness h;
    std::atomic<int> failures{0};
    std::vector<std::thread> threads;
    for (int t = 0; t < kThreads; ++t)
        threads.emplace_back([&, t] { failures += h.sendNumbered(kPerThread, t * kPerThread); });
    // Read on this thread while the writers run, so the socket buffer keeps draining.
    const QList<QJsonObject> messages = h.pair.readMessages(kThreads * kPerThread, 20000);
    for (std::thread &thread : threads)
        thread.join();
    EXPECT_EQ(failures.load(), 0);
    ASSERT_EQ(messages.size(), kThreads * kPerThread);
    std::vector<int> next(kThreads, 0);
    for (const QJsonObject &message : messages) {
        const int n = message.value("n").toInt();
        EXPECT_EQ(n % kPerThread, next[n / kPerThread]++);
        EXPECT_EQ(message.value("fill").toString().size(), 60000);
    }
}

TEST(FramedSocket, FullBufferWaitsThenFailsWithTimeout)
{
    Harness h;
    h.socket.setWriteTimeout(100);
    // The peer never reads: the buffer fills, then one send waits its bounded time and fails.
    zaf::OptionalError error;
    for (int i = 0; i < 1000 && !error; ++i)
        error = h.socket.sendFrame(QByteArray(60000, 'b'));
    ASSERT_TRUE(error.has_value());
    EXPECT_EQ(error->code, ETIMEDOUT);
}

TEST(FramedSocket, FullBufferQueuesFramesUntilThePeerReads)
{
    Harness h(FramedSocket::FullBuffer::Queue);
    EXPECT_EQ(h.sendNumbered(40), 0); // about 2.4 MB, far more than the socket buffer holds
    const QList<QJsonObject> messages = h.pair.readMessages(40, 20000);
    ASSERT_EQ(messages.size(), 40);
    for (int i = 0; i < 40; ++i)
        EXPECT_EQ(messages[i].value("n").toInt(), i);
}

TEST(FramedSocket, QueuedFramesThePeerStopsReadingAreAWriteFailure)
{
    Harness h(FramedSocket::FullBuffer::Queue);
    EXPECT_EQ(h.sendNumbered(40), 0);
    ASSERT_EQ(::shutdown(h.pair.hostFd(), SHUT_RD), 0);
    // What had arrived is still read, which makes room for the queue, whose next write fails.
    ASSERT_TRUE(waitUntil([&] {
        char chunk[65536];
        while (::recv(h.pair.hostFd(), chunk, sizeof chunk, MSG_DONTWAIT) > 0) {
        }
        return !h.writeFailures.isEmpty();
    }, 5000));
    EXPECT_EQ(h.writeFailures, QList<int>{EPIPE});
    const zaf::OptionalError after = h.socket.sendFrame("after");
    ASSERT_TRUE(after.has_value());
    EXPECT_EQ(after->code, EPIPE);
}

TEST(FramedSocket, PipeIsWrittenWithPlainWrites)
{
    int fds[2];
    ASSERT_EQ(::pipe2(fds, O_CLOEXEC), 0);
    const zaf::UniqueFd readEnd(fds[0]);
    FramedSocket socket(zaf::UniqueFd(fds[1]), 1024, FramedSocket::FullBuffer::Wait, "the host");
    ASSERT_TRUE(socket.start());
    EXPECT_FALSE(socket.sendFrame("through a pipe").has_value());
    QByteArray read(64, '\0');
    read.resize(::read(readEnd.get(), read.data(), read.size()));
    EXPECT_EQ(read, encodeFrame("through a pipe"));
}

TEST(FramedSocket, StartRefusesAClosedDescriptor)
{
    FramedSocket socket(zaf::UniqueFd(1 << 20), 1024, FramedSocket::FullBuffer::Wait, "the host");
    QString error;
    EXPECT_FALSE(socket.start(&error));
    EXPECT_TRUE(error.contains("not open")) << error.toStdString();
}
