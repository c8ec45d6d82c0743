#pragma once

// The decoded-frame window of the video decoder: the pictures it decoded around the playhead, kept in
// the decoder's own format (reference-counted frames, not converted), so that stepping back and
// forth near the playhead and a short drag over it cost no decoding.
//
// Each picture knows the picture the decoder produced right after it in the same run (no seek in
// between), so the window can tell whether it holds *the* picture shown at a time: the latest
// picture at or before it whose successor starts after it. The window is bounded by a budget in
// bytes; past it, the pictures farthest from the playhead go first. Used on the decoder's thread
// only; the figures it reports for diagnostics are read by the owner.

#include <array>
#include <cstdint>
#include <map>
#include <memory>
#include <optional>

struct AVFrame;

namespace zaf::media::playback {

class FrameWindow {
public:
    using Picture = std::shared_ptr<const AVFrame>;

    explicit FrameWindow(std::int64_t budgetBytes) : m_budget(budgetBytes) {}

    // Keeps a picture the decoder produced, `bytes` large, replacing one at the same time.
    // `previousNs`: the picture the decoder produced just before it in the same run, whose successor
    // it becomes. `first`: no picture of the stream comes before it, so it is what is shown at every
    // earlier time.
    void insert(std::int64_t ptsNs, Picture picture, std::int64_t bytes, std::optional<std::int64_t> previousNs, bool first);
    // The picture at `ptsNs` is the stream's last: it is shown at every later time.
    void markLast(std::int64_t ptsNs);

    // The time of the picture shown at `timeNs`, when the window holds it and knows it is that one.
    std::optional<std::int64_t> exactAt(std::int64_t timeNs) const;
    // The latest picture held at or before `timeNs` and not before `notBeforeNs`, known exact or not:
    // the best stand-in while the exact one is being decoded.
    std::optional<std::int64_t> latestAt(std::int64_t timeNs, std::int64_t notBeforeNs) const;
    // The time of the picture after the one at `ptsNs`, when the window holds both.
    std::optional<std::int64_t> successorOf(std::int64_t ptsNs) const;
    bool isLast(std::int64_t ptsNs) const;
    Picture picture(std::int64_t ptsNs) const;

    // Drops the pictures farthest from `focusNs` until the window fits its budget, never those in
    // `keep` (the picture on screen and the decoder's last two, which the next steps build on).
    using Kept = std::array<std::optional<std::int64_t>, 3>;
    void trim(std::int64_t focusNs, const Kept &keep);
    void setBudget(std::int64_t budgetBytes) { m_budget = budgetBytes; }
    void clear();

    std::int64_t bytes() const { return m_bytes; }
    std::int64_t budget() const { return m_budget; }
    std::size_t size() const { return m_pictures.size(); }

private:
    struct Entry {
        Picture picture;
        std::int64_t bytes = 0;
        std::optional<std::int64_t> nextNs; // the successor's time, once the decoder produced it
        bool first = false;
        bool last = false;
    };

    void erase(std::map<std::int64_t, Entry>::iterator it);

    std::int64_t m_budget;
    std::int64_t m_bytes = 0;
    std::map<std::int64_t, Entry> m_pictures;
};

} // namespace zaf::media::playback
