#pragma once

// TimelineThumbnails: the thumbnails a timeline has laid out and received. The current slots with
// their timestamps, the previous slots kept as a backdrop until the current ones are all covered,
// and the images that came back for timestamps asked since the last clear(). Plain values; the
// widget that owns it asks the data source and draws.

#include "platform/ui/timeline_model.h"

#include <QImage>

#include <map>
#include <set>

namespace zaf::ui {

class TimelineThumbnails {
public:
    const ThumbnailSlots &slots() const { return m_slots; }
    // The slots laid out before the current ones, drawn under them until they are complete.
    const ThumbnailSlots &backdrop() const { return m_backdrop; }

    // Forgets the slots, the backdrop, the images and which timestamps were asked for.
    void clear();
    // Lays `next` out: it becomes the current slots (the current ones, if they have any, become
    // the backdrop) when it has another count or window than they have, or when `force`d; true
    // when it did and has slots, which then want their timestamps. Otherwise the current slots
    // take its width and keep their timestamps.
    bool layOut(const ThumbnailSlots &next, bool force);
    // Forgets the current slots; the backdrop stays.
    void clearSlots() { m_slots = ThumbnailSlots{}; }
    // The timestamps the data source gave for the current slots; from now on they accept images.
    void setTimestamps(const QList<double> &timestamps);

    // Keeps a non-null image of an asked timestamp (a later one replaces it); false otherwise.
    bool accept(const QImage &image, double timestamp);
    // The image of a timestamp, or null.
    const QImage *imageFor(double timestamp) const;
    // How many current slots have their image.
    int imageCount() const;
    // Forgets the backdrop once every current slot has its image.
    void dropBackdropIfCovered();

private:
    ThumbnailSlots m_slots;
    ThumbnailSlots m_backdrop;
    std::set<double> m_asked;
    std::map<double, QImage> m_images;
};

} // namespace zaf::ui
