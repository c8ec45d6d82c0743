#pragma once

// Which decoded pictures answer an exact seek. Decoding starts at the keyframe before the target;
// the pictures before the target are dropped, except that the last of them is held back: when no
// picture starts exactly at the target, the held one is what is on screen there. Pure bookkeeping
// on presentation times; the decoder keeps the pictures themselves. Used on the decoder's thread.

#include <cstdint>

namespace zaf::media::playback {

class ExactSeek {
public:
    // What to do with a decoded picture.
    struct Choice {
        bool hold = false;        // keep it in place of the held picture; hand nothing on yet
        bool handOnHeld = false;  // first hand on the held picture, as the answer to the seek
        bool seekResult = false;  // hand it on as the answer to the seek (else as a picture after it)
    };

    // A new seek to `targetNs`: nothing is held.
    void begin(std::int64_t targetNs);
    // The next picture in decoding order, at `ptsNs`. Once the seek is answered, every picture is
    // handed on as it comes.
    Choice next(std::int64_t ptsNs);
    // The stream ended (or the seek is given up): true when the held picture answers the seek and is
    // to be handed on. The seek is over either way.
    bool end();
    bool seeking() const { return m_seeking; }

private:
    std::int64_t m_targetNs = 0;
    bool m_seeking = false;
    bool m_holding = false;
};

} // namespace zaf::media::playback
