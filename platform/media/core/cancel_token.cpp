#include "platform/media/core/cancel_token.h"

#include <algorithm>

namespace zaf::media {

void CancelToken::setDeadlineAfter(Clock::duration bound)
{
    m_deadline.store(std::max<Clock::rep>(1, (Clock::now() + bound).time_since_epoch().count()));
}

bool CancelToken::isCancelled() const
{
    if (m_cancelled.load())
        return true;
    const Clock::rep deadline = m_deadline.load();
    return deadline != 0 && Clock::now().time_since_epoch().count() > deadline;
}

int CancelToken::interruptCallback(void *opaque)
{
    return static_cast<const CancelToken *>(opaque)->isCancelled() ? 1 : 0;
}

} // namespace zaf::media
