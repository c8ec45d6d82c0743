#pragma once

// ImageFrameSource: the decoder behind an ImageGenerator. Private to platform/media.
//
// Holds one open demuxer and video decoder for a file and answers "the picture at time T within
// these tolerances", seeking or decoding on from the previous answer, whichever is cheaper. Not
// thread-safe: its owner serialises calls. Long I/O and decoding can be interrupted through
// `interrupt`, which is polled from FFmpeg's interrupt callback on the calling thread.

#include "platform/error.h"
#include "platform/media/core/cancel_token.h"
#include "platform/media/core/ffmpeg_ptr.h"
#include "platform/media/core/frame_converter.h"
#include "platform/media/media_asset.h"
#include "platform/media/media_time.h"

#include <QImage>
#include <QSize>
#include <QString>


namespace zaf::media {

class ImageFrameSource {
public:
    struct Request {
        MediaTime time;
        MediaTime toleranceBefore;
        MediaTime toleranceAfter;
        QSize maximumSize;           // 0 in a dimension: no limit
        bool appliesTransform = true;
    };
    struct Answer {
        QImage image;                // null on failure
        MediaTime actualTime;
        OptionalError error;
        bool cancelled = false;
    };

    // `interrupt` is polled during I/O and decoding; once cancelled it abandons the current call.
    // It must outlive the source.
    ImageFrameSource(QString path, int streamIndex, int rotationClockwise, const CancelToken &interrupt);
    ~ImageFrameSource();
    ImageFrameSource(const ImageFrameSource &) = delete;
    ImageFrameSource &operator=(const ImageFrameSource &) = delete;

    Answer imageAt(const Request &request);

private:
    OptionalError open();
    void close();
    // Next decoded frame into `out`: 0, AVERROR_EOF at the end, another AVERROR on failure.
    int nextFrame(AVFrame *out);
    bool seekTo(std::int64_t ts);
    bool keyframeOnly(std::int64_t target, std::int64_t lowest, Answer *answer, const Request &request);
    Answer deliver(const AVFrame *frame, const Request &request);
    std::int64_t toStreamTicks(const MediaTime &time, bool roundDown) const;
    std::int64_t frameDuration(const AVFrame *frame) const;
    bool interrupted() const;

    QString m_path;
    int m_streamIndex = -1;
    int m_rotation = 0;
    const CancelToken &m_interrupt;

    ff::InputFormatContextPtr m_format;
    ff::CodecContextPtr m_decoder;
    ff::AVPacketPtr m_packet;
    ff::AVFramePtr m_frame;
    ff::AVFramePtr m_last;           // the last frame decoded, while the decoder is positioned after it
    FrameConverter m_converter;
    AVStream *m_stream = nullptr;
    std::int64_t m_startTicks = 0;
    std::int64_t m_nominalDuration = 1;
    bool m_positioned = false;       // decoding can go on from m_last
    bool m_draining = false;         // end of file reached: the decoder is being drained
    std::int64_t m_skipBefore = 0;   // frames shown wholly before this can never be an answer
    OptionalError m_openError;       // a failed open is not retried
};

} // namespace zaf::media
