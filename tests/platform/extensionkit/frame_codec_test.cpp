// The frame codec: length-prefixed payloads split and joined in every way a stream can deliver them,
// and the cap on the announced length.

#include "platform/extensionkit/frame_codec.h"

#include <gtest/gtest.h>

#include <random>

using zaf::extensionkit::encodeFrame;
using zaf::extensionkit::FrameDecoder;
using zaf::extensionkit::kDefaultMaxFrameLength;

namespace {

QByteArray header(quint32 length)
{
    QByteArray bytes(4, '\0');
    bytes[0] = char(length & 0xff);
    bytes[1] = char((length >> 8) & 0xff);
    bytes[2] = char((length >> 16) & 0xff);
    bytes[3] = char((length >> 24) & 0xff);
    return bytes;
}

} // namespace

TEST(FrameCodec, EncodeWritesLittleEndianLengthThenPayload)
{
    const QByteArray payload(0x0102 + 3, 'x');
    const QByteArray frame = encodeFrame(payload);
    ASSERT_EQ(frame.size(), payload.size() + 4);
    EXPECT_EQ(frame.left(4), QByteArray::fromHex("05010000"));
    EXPECT_EQ(frame.mid(4), payload);
    EXPECT_EQ(encodeFrame(QByteArray()), QByteArray::fromHex("00000000"));
}

TEST(FrameCodec, DecodeRoundTripsWholeFramesSeveralFramesPerChunkAndEmptyPayloads)
{
    const QList<QByteArray> payloads{"{\"a\":1}", QByteArray(), QByteArray(70000, 'z'), QByteArray("\0\xff\x01", 3)};
    QByteArray stream;
    for (const QByteArray &p : payloads)
        stream += encodeFrame(p);

    FrameDecoder oneChunk;
    ASSERT_TRUE(oneChunk.feed(stream));
    EXPECT_EQ(oneChunk.takeFrames(), payloads);
    EXPECT_TRUE(oneChunk.isAtFrameBoundary());
    EXPECT_FALSE(oneChunk.takeFrame().has_value());

    FrameDecoder byteByByte;
    QList<QByteArray> got;
    for (char c : stream) {
        ASSERT_TRUE(byteByByte.feed(&c, 1));
        while (auto frame = byteByByte.takeFrame())
            got.append(*frame);
    }
    EXPECT_EQ(got, payloads);
}

TEST(FrameCodec, DecodeWithRandomChunkingMatchesThePayloadsSent)
{
    std::mt19937 random(20240611);
    for (int round = 0; round < 50; ++round) {
        QList<QByteArray> payloads;
        QByteArray stream;
        const int count = 1 + int(random() % 8);
        for (int i = 0; i < count; ++i) {
            QByteArray p(int(random() % 3000), Qt::Uninitialized);
            for (char &c : p)
                c = char(random());
            payloads.append(p);
            stream += encodeFrame(p);
        }
        FrameDecoder decoder;
        QList<QByteArray> got;
        qsizetype offset = 0;
        while (offset < stream.size()) {
            const qsizetype chunk = std::min<qsizetype>(1 + random() % 700, stream.size() - offset);
            ASSERT_TRUE(decoder.feed(stream.constData() + offset, chunk));
            offset += chunk;
            got += decoder.takeFrames();
        }
        ASSERT_EQ(got, payloads) << "round " << round;
    }
}

TEST(FrameCodec, TruncatedFrameYieldsNothingAndReportsPendingBytes)
{
    FrameDecoder decoder;
    const QByteArray frame = encodeFrame("hello world");
    ASSERT_TRUE(decoder.feed(frame.left(2)));
    EXPECT_EQ(decoder.pendingBytes(), 2);
    ASSERT_TRUE(decoder.feed(frame.mid(2, 5)));
    EXPECT_FALSE(decoder.hasFrame());
    EXPECT_EQ(decoder.pendingBytes(), 7);
    EXPECT_FALSE(decoder.isAtFrameBoundary());
    ASSERT_TRUE(decoder.feed(frame.mid(7)));
    EXPECT_EQ(decoder.takeFrame(), QByteArray("hello world"));
    EXPECT_TRUE(decoder.isAtFrameBoundary());
}

TEST(FrameCodec, LengthAtTheCapIsAcceptedAndOneMoreIsRefused)
{
    FrameDecoder atCap;
    const QByteArray largest(int(kDefaultMaxFrameLength), 'a');
    ASSERT_TRUE(atCap.feed(encodeFrame(largest)));
    EXPECT_EQ(atCap.takeFrame(), largest);

    FrameDecoder overCap;
    EXPECT_FALSE(overCap.feed(header(kDefaultMaxFrameLength + 1)));
    EXPECT_EQ(overCap.status(), FrameDecoder::Status::TooLarge);
    EXPECT_TRUE(overCap.errorString().contains(QString::number(kDefaultMaxFrameLength + 1)));
    EXPECT_FALSE(overCap.hasFrame());
    EXPECT_EQ(overCap.pendingBytes(), 0);

    FrameDecoder smallCap(16);
    EXPECT_TRUE(smallCap.feed(encodeFrame(QByteArray(16, 'b'))));
    EXPECT_FALSE(smallCap.feed(encodeFrame(QByteArray(17, 'b'))));
    // The frame that was complete before the bad length is still there.
    EXPECT_EQ(smallCap.takeFrames(), QList<QByteArray>{QByteArray(16, 'b')});
}

TEST(FrameCodec, ErrorIsStickyAndLaterInputIsDiscarded)
{
    FrameDecoder decoder(8);
    EXPECT_FALSE(decoder.feed(header(0xffffffffu)));
    EXPECT_FALSE(decoder.feed(encodeFrame("ok")));
    EXPECT_FALSE(decoder.hasFrame());
    EXPECT_TRUE(decoder.hasError());
}

TEST(FrameCodec, HugeAnnouncedLengthUnderAHugeCapIsNotReservedUpFront)
{
    // With the cap lifted to the largest length, a 4 GiB announcement followed by a few bytes must
    // only hold those bytes: reserving the announced size would fail or exhaust memory.
    FrameDecoder decoder(0xffffffffu);
    ASSERT_TRUE(decoder.feed(header(0xfffffff0u) + QByteArray(100, 'q')));
    EXPECT_FALSE(decoder.hasFrame());
    EXPECT_EQ(decoder.pendingBytes(), 104);
}

TEST(FrameCodec, RandomBytesNeverYieldAFrameAboveTheCap)
{
    std::mt19937 random(7);
    for (int round = 0; round < 200; ++round) {
        FrameDecoder decoder(4096);
        QByteArray bytes(int(random() % 20000), Qt::Uninitialized);
        for (char &c : bytes)
            c = char(random());
        // Make small lengths likely so that some frames complete.
        if (round % 2 == 0 && bytes.size() > 4)
            bytes[2] = bytes[3] = 0;
        qsizetype offset = 0;
        while (offset < bytes.size()) {
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
