// The input layer every media stage opens files through: cancel token, openInput, decoder set-up.

#include "platform/media/core/cancel_token.h"
#include "platform/media/core/decoder_setup.h"
#include "platform/media/core/media_input.h"
#include "tests/support/media/fixture_movies.h"
#include "tests/support/named_cases.h"
#include "tests/support/temp_dir.h"

#include <QDir>
#include <QFile>

#include <gtest/gtest.h>

#include <csignal>
#include <thread>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace zaf::media {
namespace {

using zaf::test::ScratchDir;

TEST(CancelTokenTest, FlagCancelsUntilReset)
{
    CancelToken token;
    EXPECT_FALSE(token.isCancelled());
    EXPECT_EQ(CancelToken::interruptCallback(&token), 0);
    token.cancel();
    EXPECT_TRUE(token.isCancelled());
    EXPECT_EQ(CancelToken::interruptCallback(&token), 1);
    token.reset();
    EXPECT_FALSE(token.isCancelled());
}

// A deadline cancels once it has passed, and a reset, which clears only the flag, keeps it.
TEST(CancelTokenTest, PassedDeadlineCancelsEvenAfterReset)
{
    CancelToken token;
    token.setDeadlineAfter(std::chrono::hours(1));
    EXPECT_FALSE(token.isCancelled());
    token.setDeadlineAfter(-std::chrono::milliseconds(1));
    EXPECT_TRUE(token.isCancelled());
    token.reset();
    EXPECT_TRUE(token.isCancelled());
}

enum class Token { Fresh, Cancelled, DeadlinePassed };

struct OpenCase {
    const char *name;
    QString (*makeFile)(const ScratchDir &); // returns the path to open
    Token token;
    bool opens;
    const char *errorPart;                   // part of the error when it does not open
};

QString movieCopy(const ScratchDir &dir, const QString &name)
{
    const QString path = dir.file(name);
    EXPECT_TRUE(QFile::copy(zaf::test::sharedFlatColourMovie(QSize(64, 48)), path));
    return path;
}

QString movie(const ScratchDir &d)
{
    return movieCopy(d, QStringLiteral("movie.mp4"));
}

const OpenCase kOpenCases[] = {
    {"Movie", movie, Token::Fresh, true, ""},
    {"NonAsciiName", [](const ScratchDir &d) { return movieCopy(d, QStringLiteral("Aufnahme é 日本 10:43.mp4")); }, Token::Fresh, true, ""},
    // Relative, with what looks like a protocol in front: still the local file of that name.
    {"NameLikeAProtocol", [](const ScratchDir &d) { movieCopy(d, QStringLiteral("clip:1.mp4")); return QDir::setCurrent(d.path()) ? QStringLiteral("clip:1.mp4") : QString(); }, Token::Fresh, true, ""},
    {"CancelledBefore", movie, Token::Cancelled, false, "cancelled"},
    {"DeadlinePassed", movie, Token::DeadlinePassed, false, "movie.mp4"},
    {"Missing", [](const ScratchDir &d) { return d.file(QStringLiteral("nothing-here.mp4")); }, Token::Fresh, false, "cannot open"},
    {"Garbage", [](const ScratchDir &d) { return d.write(QStringLiteral("garbage.mp4"), 5000); }, Token::Fresh, false, "garbage.mp4"},
};

class OpenInputTest : public testing::TestWithParam<OpenCase> {
protected:
    void TearDown() override { QDir::setCurrent(m_cwd); }
    QString m_cwd = QDir::currentPath();
};

TEST_P(OpenInputTest, OpensLocalFilesAndFailsWithANamedErrorOtherwise)
{
    const OpenCase &c = GetParam();
    ScratchDir dir;
    const QString path = c.makeFile(dir);
    ASSERT_FALSE(path.isEmpty());
    CancelToken token;
    if (c.token == Token::Cancelled)
        token.cancel();
    if (c.token == Token::DeadlinePassed)
        token.setDeadlineAfter(-std::chrono::milliseconds(1));
    QString error;
    const ff::InputFormatContextPtr format = openInput(path, token, &error);
    EXPECT_EQ(bool(format), c.opens) << error.toStdString();
    if (c.opens) {
        EXPECT_EQ(format->nb_streams, 2u);
    } else {
        EXPECT_TRUE(error.contains(QString::fromUtf8(c.errorPart))) << error.toStdString();
    }
}

INSTANTIATE_TEST_SUITE_P(Files, OpenInputTest, testing::ValuesIn(kOpenCases),
                         zaf::test::caseName);

// A cancel from another thread while the open waits for data ends it at the next read: a pipe
// hands over the start of a movie, the token is cancelled (or not), and the rest follows.
class OpenInputFromAPipe : public testing::TestWithParam<bool> {};

TEST_P(OpenInputFromAPipe, FailsAsCancelledOnlyWhenCancelledWhileWaiting)
{
    const bool cancel = GetParam();
    std::signal(SIGPIPE, SIG_IGN);
    ScratchDir dir;
    // Header first: readable from a pipe.
    const QByteArray bytes = zaf::test::fileContents(zaf::test::sharedFfmpegOutput(
        QStringList{QStringLiteral("-i"), zaf::test::sharedFlatColourMovie(QSize(64, 48))} << zaf::test::words("-c copy -movflags +faststart")));
    ASSERT_GT(bytes.size(), 4000);
    const QByteArray fifo = QFile::encodeName(dir.file(QStringLiteral("movie.mp4")));
    ASSERT_EQ(mkfifo(fifo.constData(), 0600), 0);
    CancelToken token;
    std::thread writer([&] {
        const int fd = ::open(fifo.constData(), O_WRONLY); // waits for the reader
        if (fd < 0)
            return;
        qsizetype written = ::write(fd, bytes.constData(), 100);
        std::this_thread::sleep_for(std::chrono::milliseconds(100)); // the reader waits for more
        if (cancel)
            token.cancel();
        while (written < bytes.size()) {
            const ssize_t n = ::write(fd, bytes.constData() + written, bytes.size() - written);
            if (n <= 0)
                break; // the reader has gone
            written += n;
        }
        ::close(fd);
    });
    QString error;
    const ff::InputFormatContextPtr format = openInput(QFile::decodeName(fifo), token, &error);
    writer.join();
    EXPECT_EQ(bool(format), !cancel) << error.toStdString();
    EXPECT_EQ(error.contains(QStringLiteral("cancelled")), cancel) << error.toStdString();
}

INSTANTIATE_TEST_SUITE_P(Cancel, OpenInputFromAPipe, testing::Bool(),
                         [](const auto &info) { return info.param ? "Cancelled" : "NotCancelled"; });

// Every decoder is made with the same limits: the pixel limit refuses a larger video stream up
// front, and audio streams are not affected by it.
class DecoderSetupTest : public testing::TestWithParam<AVMediaType> {
protected:
    void SetUp() override
    {
        format = openInput(zaf::test::sharedFlatColourMovie(QSize(64, 48)), token, &error);
        ASSERT_TRUE(format) << error.toStdString();
        for (unsigned i = 0; i < format->nb_streams; ++i) {
            if (format->streams[i]->codecpar->codec_type == GetParam())
                stream = format->streams[i];
        }
        ASSERT_NE(stream, nullptr);
    }
    const CancelToken token;
    QString error;
    ff::InputFormatContextPtr format;
    const AVStream *stream = nullptr;
};

TEST_P(DecoderSetupTest, OpensWithTheSharedLimits)
{
    const ff::CodecContextPtr decoder = openDecoder(stream, DecoderOptions{2, 0, 64 * 48}, &error);
    ASSERT_TRUE(decoder) << error.toStdString();
    EXPECT_EQ(decoder->max_pixels, 64 * 48);
    EXPECT_EQ(decoder->pkt_timebase.den, stream->time_base.den);
    if (GetParam() == AVMEDIA_TYPE_VIDEO) { // audio decoders without threading support run on one
        EXPECT_EQ(decoder->thread_count, 2);
    }
}

TEST_P(DecoderSetupTest, PixelLimitRefusesOnlyLargerPictures)
{
    const bool video = GetParam() == AVMEDIA_TYPE_VIDEO;
    const ff::CodecContextPtr limited = openDecoder(stream, DecoderOptions{1, 0, 64 * 48 - 1}, &error);
    EXPECT_EQ(bool(limited), !video);
    EXPECT_EQ(error.contains(QStringLiteral("unusable size 64x48")), video) << error.toStdString();
}

INSTANTIATE_TEST_SUITE_P(Streams, DecoderSetupTest, testing::Values(AVMEDIA_TYPE_VIDEO, AVMEDIA_TYPE_AUDIO),
                         [](const auto &info) { return info.param == AVMEDIA_TYPE_VIDEO ? "Video" : "Audio"; });

} // namespace
} // namespace zaf::media
