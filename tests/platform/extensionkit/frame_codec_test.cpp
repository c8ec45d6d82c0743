// The frame codec: payloads however a stream splits them, and the cap on the announced length.

#include "platform/extensionkit/frame_codec.h"

#include <gtest/gtest.h>

#include <random>

using zaf::extensionkit::encodeFrame;
using zaf::extensionkit::FrameDecoder;
using zaf::extensionkit::kDefaultMaxFrameLength;

namespace {

QByteArray randomBytes(std::mt19937 &random, int size)
{
    QByteArray bytes(size, Qt::Uninitialized);
    for (char &c : bytes)
        c = char(random());
    return bytes;
}

} // namespace

TEST(FrameCodec, EncodeWritesLittleEndianLengthThenPayload)
{
    const QByteArray payload(0x0105, 'x');
    EXPECT_EQ(encodeFrame(payload), QByteArray::fromHex("05010000") + payload);
    EXPECT_EQ(encodeFrame(QByteArray()), QByteArray::fromHex("00000000"));
}

TEST(FrameCodec, DecodeGivesBackThePayloadsHoweverTheStreamIsChunked)
{
    // Round 0 feeds the stream whole, round 1 a byte at a time, the others in random chunks.
    std::mt19937 random(20240611);
    for (int round = 0; round < 50; ++round) {
        QList<QByteArray> payloads{"{\"a\":1}", QByteArray(), QByteArray(70000, 'z'), QByteArray("\0\xff\x01", 3)};
        for (int i = int(random() % 8); i > 0; --i)
            payloads.append(randomBytes(random, int(random() % 3000)));
        QByteArray stream;
        for (const QByteArray &p : payloads)
            stream += encodeFrame(p);
        FrameDecoder decoder;
        QList<QByteArray> got;
        for (qsizetype offset = 0; offset < stream.size();) {
            const qsizetype chunk = round == 0 ? stream.size() : round == 1 ? 1 : std::min<qsizetype>(1 + random() % 700, stream.size() - offset);
            ASSERT_TRUE(decoder.feed(stream.constData() + offset, chunk));
            offset += chunk;
            while (std::optional<QByteArray> frame = decoder.takeFrame())
                got.append(*frame);
        }
        ASSERT_EQ(got, payloads) << "round " << round;
        EXPECT_TRUE(decoder.isAtFrameBoundary());
    }
}

TEST(FrameCodec, LengthAtTheCapIsAccepted)
{
    FrameDecoder decoder;
    const QByteArray largest(int(kDefaultMaxFrameLength), 'a');
    ASSERT_TRUE(decoder.feed(encodeFrame(largest)));
    EXPECT_EQ(decoder.takeFrame(), largest);
}

TEST(FrameCodec, LengthAboveTheCapIsAStickyError)
{
    FrameDecoder decoder;
    EXPECT_FALSE(decoder.feed(QByteArray::fromHex("01001000"))); // 1 MiB + 1
    EXPECT_EQ(decoder.status(), FrameDecoder::Status::TooLarge);
    EXPECT_TRUE(decoder.errorString().contains(QString::number(kDefaultMaxFrameLength + 1)));
    EXPECT_EQ(decoder.pendingBytes(), 0);
    // Input after the error is discarded, even a valid frame.
    EXPECT_FALSE(decoder.feed(encodeFrame("ok")));
    EXPECT_FALSE(decoder.hasFrame());
}

TEST(FrameCodec, FrameCompleteBeforeABadLengthIsKept)
{
    FrameDecoder decoder(16);
    EXPECT_TRUE(decoder.feed(encodeFrame(QByteArray(16, 'b'))));
    EXPECT_FALSE(decoder.feed(encodeFrame(QByteArray(17, 'b'))));
    EXPECT_EQ(decoder.takeFrames(), QList<QByteArray>{QByteArray(16, 'b')});
}

TEST(FrameCodec, PendingBytesAreOnlyThoseReceived)
{
    // With the cap lifted, a 4 GiB announcement holds only the bytes received (a partial header
    // counts too), not the announced size.
    FrameDecoder decoder(0xffffffffu);
    ASSERT_TRUE(decoder.feed(QByteArray::fromHex("f0ff")));
    EXPECT_EQ(decoder.pendingBytes(), 2);
    EXPECT_FALSE(decoder.isAtFrameBoundary());
    ASSERT_TRUE(decoder.feed(QByteArray::fromHex("ffff") + QByteArray(100, 'q')));
    EXPECT_FALSE(decoder.hasFrame());
    EXPECT_EQ(decoder.pendingBytes(), 104);
}

TEST(FrameCodec, RandomBytesNeverYieldAFrameAboveTheCap)
{
    std::mt19937 random(7);
    for (int round = 0; round < 200; ++round) {
        FrameDecoder decoder(4096);
        QByteArray bytes = randomBytes(random, int(random() % 20000));
        if (round % 2 == 0 && bytes.size() > 4)
            bytes[2] = bytes[3] = 0; // small lengths, so that some frames complete
        for (qsizetype offset = 0; offset < bytes.size();) {
            const qsizetype chunk = std::min<qsizetype>(1 + random() % 512, bytes.size() - offset);
            const bool ok = decoder.feed(bytes.constData() + offset, chunk);
            offset += chunk;
            for (const QByteArray &frame : decoder.takeFrames())
                ASSERT_LE(frame.size(), 4096);
            ASSERT_LE(decoder.pendingBytes(), 4 + 4096);
            if (!ok) {
                ASSERT_TRUE(decoder.hasError());
                break;
            }
        }
    }
}
