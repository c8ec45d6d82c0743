#pragma once

// The video stage of a smart cut (private to platform/media). For an H.264 source it copies every
// whole group of pictures that lies inside the cut packet for packet, and re-encodes only the
// pictures at the two cuts: from the picture shown at the start to the first clean IDR, and from the
// last clean IDR to the end. The re-encoded stretches carry parameter sets of their own, under an id
// the source does not use, and both sets sit in the output's sample description, so one track holds
// both. Decode timestamps stay strictly increasing across every splice whatever the source's
// B-frame delay; the stream's side data (rotation) is the source's.
//
// A group is copied only when it starts at an IDR with no picture shown before it, holds no
// parameter set under the splice id, and every picture of it lies before the end. Anything else is
// re-encoded, so the output holds exactly the pictures shown during the cut.
//
// Input: the source stream's packets through sendPacket(). Output: packets handed to the
// PacketWriter for the output stream it was given. Every call runs on the export's worker thread.

#include "platform/media/export/export_common.h"

#include <QList>
#include <QString>

#include <memory>
#include <optional>

namespace zaf::media::exportpipe {

// A splice that cannot be made after all (an encoder whose parameter sets change, timestamps that
// cannot be placed): the export is redone as a full re-encode, so this error never reaches a caller.
Error spliceError(const QString &why);
bool isSpliceError(const Error &error);

class ExportVideoSplicer {
public:
    struct Options {
        const AVStream *input = nullptr;
        std::int64_t startMicros = 0;   // in the source's timestamps: the picture shown at this instant comes first
        std::int64_t endMicros = 0;     // pictures starting at or after it are dropped
    };

    // Why `input` cannot be spliced (another codec, a format the encoder cannot reproduce, interlaced
    // pictures, a sample description that cannot be read); null if it can.
    static std::optional<QString> whyNotSpliceable(const AVStream *input);

    // Opens the first stretch's encoder and writes the joint sample description into `output`, a
    // stream that copies the input's parameters (its header is not written yet). Null with `error`
    // set if that fails.
    static std::unique_ptr<ExportVideoSplicer> create(const Options &options, AVStream *output,
                                                      PacketWriter writer, Error *error);
    ~ExportVideoSplicer();

    int sourceStreamIndex() const;
    StageResult sendPacket(const AVPacket *packet);
    // Resolves what is still held and drains the encoders at the end of the input.
    StageResult finish();
    // True once nothing after the current packet can be in the cut.
    bool isPastEnd() const;
    // The output times (microseconds) at which copied and re-encoded pictures meet.
    QList<std::int64_t> splicePoints() const;
    // Pictures copied from the source and pictures re-encoded so far.
    int copiedPictures() const;
    int encodedPictures() const;

private:
    ExportVideoSplicer();
    struct Private;
    std::unique_ptr<Private> d;
};

} // namespace zaf::media::exportpipe
