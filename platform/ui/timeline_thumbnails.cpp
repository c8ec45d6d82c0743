#include "platform/ui/timeline_thumbnails.h"

#include <algorithm>
#include <cmath>

namespace zaf::ui {

void TimelineThumbnails::clear()
{
    m_slots = ThumbnailSlots{};
    m_backdrop = ThumbnailSlots{};
    m_asked.clear();
    m_images.clear();
}

bool TimelineThumbnails::layOut(const ThumbnailSlots &next, bool force)
{
    if (!force && next.count == m_slots.count && next.window == m_slots.window) {
        m_slots.slotFraction = next.slotFraction; // same timestamps, wider or narrower slots
        return false;
    }
    if (m_slots.count > 0)
        m_backdrop = m_slots;
    m_slots = next;
    return next.count > 0;
}

void TimelineThumbnails::setTimestamps(const QList<double> &timestamps)
{
    m_slots.timestamps = timestamps;
    for (double t : timestamps) {
        if (!std::isnan(t))
            m_asked.insert(t);
    }
}

bool TimelineThumbnails::accept(const QImage &image, double timestamp)
{
    if (image.isNull() || m_asked.count(timestamp) == 0)
        return false;
    // Drawing converts any other format on every paint; convert once here.
    m_images[timestamp] = image.convertToFormat(image.hasAlphaChannel() ? QImage::Format_ARGB32_Premultiplied
                                                                         : QImage::Format_RGB32);
    return true;
}

const QImage *TimelineThumbnails::imageFor(double timestamp) const
{
    const auto found = m_images.find(timestamp);
    return found == m_images.end() ? nullptr : &found->second;
}

int TimelineThumbnails::imageCount() const
{
    return int(std::count_if(m_slots.timestamps.begin(), m_slots.timestamps.end(),
                             [this](double t) { return m_images.count(t) > 0; }));
}

void TimelineThumbnails::dropBackdropIfCovered()
{
    if (m_backdrop.count > 0 && imageCount() == m_slots.timestamps.size())
        m_backdrop = ThumbnailSlots{};
}

} // namespace zaf::ui
