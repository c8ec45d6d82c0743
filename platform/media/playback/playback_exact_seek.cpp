#include "platform/media/playback/playback_exact_seek.h"

#include <utility>

namespace zaf::media::playback {

void ExactSeek::begin(std::int64_t targetNs)
{
    m_targetNs = targetNs;
    m_seeking = true;
    m_holding = false;
}

ExactSeek::Choice ExactSeek::next(std::int64_t ptsNs)
{
    if (!m_seeking)
        return {};
    if (ptsNs < m_targetNs) {
        m_holding = true;
        return {.hold = true};
    }
    m_seeking = false;
    // A picture past the target: the held one, which started before it, is the one shown there.
    if (ptsNs > m_targetNs && std::exchange(m_holding, false))
        return {.handOnHeld = true};
    m_holding = false;
    return {.seekResult = true};
}

bool ExactSeek::end()
{
    const bool handOnHeld = m_seeking && m_holding;
    m_seeking = false;
    m_holding = false;
    return handOnHeld;
}

} // namespace zaf::media::playback
