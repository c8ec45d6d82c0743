#pragma once

// The audio mix of an export: which audio tracks of the source enter the output's single mixed
// audio track. Every listed track is summed at unity gain; the sum is limited to avoid clipping.

#include <QList>

#include <cstdint>

namespace zaf::media {

// One input of an audio mix: the track ID of a source audio track (AssetTrack::trackID).
// Tracks enter the mix at unity gain; there is no per-track volume.
struct AudioMixInputParameters {
    std::int32_t trackID = 0;
};

struct AudioMix {
    // The tracks to mix, in order. Empty: the output has no audio track.
    QList<AudioMixInputParameters> inputParameters;
};

} // namespace zaf::media
