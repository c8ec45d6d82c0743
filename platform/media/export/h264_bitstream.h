#pragma once

// Reading and writing the few parts of an H.264 stream that splicing needs (private to
// platform/media): the NAL units of a sample, whether a sample is an IDR picture, the ids of
// parameter sets, and the MPEG-4 sample description (avcC) that holds them. Samples in an MPEG-4
// file are length-prefixed NAL units; an encoder hands out Annex B (start codes), so both forms are
// read. Pure functions on bytes: callable from any thread.

#include <QByteArray>
#include <QList>

#include <functional>
#include <optional>

namespace zaf::media::h264 {

enum NalType : int {
    kNalSlice = 1,
    kNalIdrSlice = 5,
    kNalSps = 7,
    kNalPps = 8,
};

// Calls `visit` with each NAL unit (header byte included) of a sample whose units carry a
// big-endian length of `lengthSize` bytes (1, 2 or 4). Returns false if the sample is malformed.
bool forEachLengthPrefixedNal(const uint8_t *data, int size, int lengthSize,
                              const std::function<void(const uint8_t *nal, int size)> &visit);

// The NAL units of an Annex B byte stream (three- or four-byte start codes), without the codes.
QList<QByteArray> annexBNalUnits(const uint8_t *data, int size);

// An Annex B stream rewritten as length-prefixed NAL units. Null if a unit is too long for
// `lengthSize`.
std::optional<QByteArray> annexBToLengthPrefixed(const uint8_t *data, int size, int lengthSize);

// The id a parameter set declares: seq_parameter_set_id of an SPS, pic_parameter_set_id of a PPS.
// Null for other units or a unit too short to hold it.
std::optional<int> parameterSetId(const QByteArray &nal);

// The decoder configuration record (avcC) of an MPEG-4 sample description.
struct DecoderConfiguration {
    int profile = 0;
    int compatibility = 0;
    int level = 0;
    int lengthSize = 4;
    QList<QByteArray> sps;
    QList<QByteArray> pps;
    QByteArray trailer;     // the high-profile extension fields after the PPS list, kept verbatim

    static std::optional<DecoderConfiguration> parse(const uint8_t *data, int size);
    QByteArray serialize() const;
    // Every SPS and PPS id in use.
    QList<int> usedIds() const;
};

} // namespace zaf::media::h264
