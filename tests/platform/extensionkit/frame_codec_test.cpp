// The frame codec: length-prefixed payloads split and joined in every way a stream can deliver them,
// and the cap on the announced length.

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

TEST(FrameCodec, LengthAtTheCapIsAcceptedAndAboveItIsAStickyError)
{
    FrameDecoder atCap;
    const QByteArray largest(int(kDefaultMaxFrameLength), 'a');
    ASSERT_TRUE(atCap.feed(encodeFrame(largest)));
    EXPECT_EQ(atCap.takeFrame(), largest);

    FrameDecoder overCap;
    EXPECT_FALSE(overCap.feed(QByteArray::fromHex("01001000"))); // 1 MiB + 1
    EXPECT_EQ(overCap.status(), FrameDecoder::Status::TooLarge);
    EXPECT_TRUE(overCap.errorString().contains(QString::number(kDefaultMaxFrameLength + 1)));
    EXPECT_EQ(overCap.pendingBytes(), 0);
    // Input after the error is discarded, even a valid frame.
    EXPECT_FALSE(overCap.feed(encodeFrame("ok")));
    EXPECT_FALSE(overCap.hasFrame());

    // A frame complete before the bad length is still there.
    FrameDecoder smallCap(16);
    EXPECT_TRUE(smallCap.feed(encodeFrame(QByteArray(16, 'b'))));
    EXPECT_FALSE(smallCap.feed(encodeFrame(QByteArray(17, 'b'))));
    EXPECT_EQ(smallCap.takeFrames(), QList<QByteArray>{QByteArray(16, 'b')});

    // With the cap lifted, a 4 GiB announcement holds only the bytes received (a partial header
    // counts too), not the announced size.
    FrameDecoder hugeCap(0xffffffffu);
    ASSERT_TRUE(hugeCap.feed(QByteArray::fromHex("f0ff")));
    EXPECT_EQ(hugeCap.pendingBytes(), 2);
    EXPECT_FALSE(hugeCap.isAtFrameBoundary());
    ASSERT_TRUE(hugeCap.feed(QByteArray::fromHex("ffff") + QByteArray(100, 'q')));
    EXPECT_FALSE(hugeCap.hasFrame());
    EXPECT_EQ(hugeCap.pendingBytes(), 104);
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
