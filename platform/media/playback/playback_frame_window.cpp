#include "platform/media/playback/playback_frame_window.h"

#include <algorithm>
#include <iterator>
#include <utility>

namespace zaf::media::playback {

void FrameWindow::insert(std::int64_t ptsNs, Picture picture, std::int64_t bytes, std::optional<std::int64_t> previousNs, bool first)
{
    if (auto old = m_pictures.find(ptsNs); old != m_pictures.end())
        erase(old);
    Entry &entry = m_pictures[ptsNs];
    entry.picture = std::move(picture);
    entry.bytes = bytes;
    entry.first = first;
    m_bytes += bytes;
    // Only a successor that comes later links: a stream whose times go backwards gets no links, and
    // its pictures are decoded again when asked for.
    if (previousNs && *previousNs < ptsNs) {
        if (auto previous = m_pictures.find(*previousNs); previous != m_pictures.end())
            previous->second.nextNs = ptsNs;
    }
}

void FrameWindow::markLast(std::int64_t ptsNs)
{
    if (auto it = m_pictures.find(ptsNs); it != m_pictures.end())
        it->second.last = true;
}

std::optional<std::int64_t> FrameWindow::exactAt(std::int64_t timeNs) const
{
    auto after = m_pictures.upper_bound(timeNs);
    if (after == m_pictures.begin())
        return after != m_pictures.end() && after->second.first ? std::optional(after->first) : std::nullopt;
    const auto &[ptsNs, entry] = *std::prev(after);
    if (entry.last || (entry.nextNs && *entry.nextNs > timeNs))
        return ptsNs;
    return std::nullopt;
}

std::optional<std::int64_t> FrameWindow::latestAt(std::int64_t timeNs, std::int64_t notBeforeNs) const
{
    auto after = m_pictures.upper_bound(timeNs);
    if (after == m_pictures.begin())
        return std::nullopt;
    const std::int64_t ptsNs = std::prev(after)->first;
    return ptsNs >= notBeforeNs ? std::optional(ptsNs) : std::nullopt;
}

std::optional<std::int64_t> FrameWindow::successorOf(std::int64_t ptsNs) const
{
    auto it = m_pictures.find(ptsNs);
    if (it == m_pictures.end() || !it->second.nextNs || !m_pictures.contains(*it->second.nextNs))
        return std::nullopt;
    return it->second.nextNs;
}

bool FrameWindow::isLast(std::int64_t ptsNs) const
{
    auto it = m_pictures.find(ptsNs);
    return it != m_pictures.end() && it->second.last;
}

FrameWindow::Picture FrameWindow::picture(std::int64_t ptsNs) const
{
    auto it = m_pictures.find(ptsNs);
    return it == m_pictures.end() ? nullptr : it->second.picture;
}

void FrameWindow::trim(std::int64_t focusNs, const Kept &keep)
{
    auto kept = [&](std::int64_t ptsNs) { return std::find(keep.begin(), keep.end(), ptsNs) != keep.end(); };
    while (m_bytes > m_budget && !m_pictures.empty()) {
        // The farthest picture from the focus is at one end of the time-ordered map.
        auto front = m_pictures.begin();
        auto back = std::prev(m_pictures.end());
        while (front != m_pictures.end() && kept(front->first))
            ++front;
        while (back != m_pictures.begin() && kept(back->first))
            --back;
        const bool frontUsable = front != m_pictures.end() && !kept(front->first);
        const bool backUsable = !kept(back->first);
        if (!frontUsable && !backUsable)
            return;
        if (!backUsable || (frontUsable && focusNs - front->first >= back->first - focusNs))
            erase(front);
        else
            erase(back);
    }
}

void FrameWindow::clear()
{
    m_pictures.clear();
    m_bytes = 0;
}

void FrameWindow::erase(std::map<std::int64_t, Entry>::iterator it)
{
    m_bytes -= it->second.bytes;
    m_pictures.erase(it);
}

} // namespace zaf::media::playback
