#include "host/watch/offer_queue.h"

namespace zaf::host::watch {

bool OfferQueue::push(const QString &path)
{
    if (m_paths.contains(path))
        return false;
    m_paths.append(path);
    return true;
}

std::optional<QString> OfferQueue::pop()
{
    if (m_paths.isEmpty())
        return std::nullopt;
    return m_paths.takeFirst();
}

qsizetype OfferQueue::clear()
{
    const qsizetype dropped = m_paths.size();
    m_paths.clear();
    return dropped;
}

} // namespace zaf::host::watch
