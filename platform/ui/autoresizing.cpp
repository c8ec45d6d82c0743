#include "platform/ui/autoresizing.h"

#include <QEvent>
#include <QPointer>
#include <QRectF>
#include <QResizeEvent>
#include <QWidget>

#include <cmath>
#include <utility>

namespace zaf::ui {

namespace {

// One axis of a frame in its container: margin before, size, margin after.
struct Axis {
    double before, size, after;
};

// Shares `delta` among the flexible parts of an axis in proportion to their sizes.
Axis resizeAxis(Axis axis, double delta, bool flexBefore, bool flexSize, bool flexAfter)
{
    const double parts[3] = {flexBefore ? std::max(0.0, axis.before) : 0.0, flexSize ? std::max(0.0, axis.size) : 0.0,
                             flexAfter ? std::max(0.0, axis.after) : 0.0};
    const bool flexible[3] = {flexBefore, flexSize, flexAfter};
    const int count = int(flexBefore) + int(flexSize) + int(flexAfter);
    if (count == 0)
        return axis;
    const double total = parts[0] + parts[1] + parts[2];
    double share[3];
    for (int i = 0; i < 3; ++i)
        share[i] = !flexible[i] ? 0.0 : total > 0 ? delta * parts[i] / total : delta / count;
    return Axis{axis.before + share[0], std::max(0.0, axis.size + share[1]), axis.after + share[2]};
}

// Follows the container of one view. A child of the view, so it goes with it.
class AutoresizingFollower : public QObject {
public:
    AutoresizingFollower(QWidget *view, AutoresizingMask mask)
        : QObject(view)
        , m_view(view)
        , m_mask(mask)
        , m_frame(view->geometry())
    {
        view->installEventFilter(this);
        watch(view->parentWidget());
    }

    void setMask(AutoresizingMask mask) { m_mask = mask; }
    AutoresizingMask mask() const { return m_mask; }

protected:
    bool eventFilter(QObject *watched, QEvent *event) override
    {
        if (watched == m_view) {
            if (event->type() == QEvent::ParentChange)
                watch(m_view->parentWidget());
            else if ((event->type() == QEvent::Move || event->type() == QEvent::Resize) && !m_applying
                     && m_view->geometry() != m_frame.toRect())
                m_frame = m_view->geometry(); // moved by its owner: start from there
        } else if (watched == m_container && event->type() == QEvent::Resize) {
            // Qt holds back the resize events of a hidden widget and sends one, without the old
            // size, when it is shown: the size last followed is the one to start from.
            const QSize size = static_cast<QResizeEvent *>(event)->size();
            if (size != m_containerSize)
                follow(std::exchange(m_containerSize, size), size);
        }
        return QObject::eventFilter(watched, event);
    }

private:
    void watch(QWidget *container)
    {
        if (m_container)
            m_container->removeEventFilter(this);
        m_container = container;
        m_containerSize = container ? container->size() : QSize();
        m_frame = m_view->geometry();
        if (container)
            container->installEventFilter(this);
    }

    void follow(const QSize &from, const QSize &to)
    {
        const Axis x = resizeAxis({m_frame.x(), m_frame.width(), from.width() - m_frame.right()}, to.width() - from.width(),
                                  m_mask & Autoresizing::FlexibleLeftMargin, m_mask & Autoresizing::FlexibleWidth,
                                  m_mask & Autoresizing::FlexibleRightMargin);
        const Axis y = resizeAxis({m_frame.y(), m_frame.height(), from.height() - m_frame.bottom()}, to.height() - from.height(),
                                  m_mask & Autoresizing::FlexibleTopMargin, m_mask & Autoresizing::FlexibleHeight,
                                  m_mask & Autoresizing::FlexibleBottomMargin);
        m_frame = QRectF(x.before, y.before, x.size, y.size);
        m_applying = true;
        m_view->setGeometry(QRect(QPoint(int(std::lround(m_frame.x())), int(std::lround(m_frame.y()))),
                                  QSize(int(std::lround(m_frame.width())), int(std::lround(m_frame.height())))));
        m_applying = false;
    }

    QWidget *m_view;
    QPointer<QWidget> m_container;
    QSize m_containerSize;
    AutoresizingMask m_mask;
    QRectF m_frame;
    bool m_applying = false;
};

AutoresizingFollower *followerOf(const QWidget *view)
{
    for (QObject *child : view->children()) {
        if (auto *follower = dynamic_cast<AutoresizingFollower *>(child))
            return follower;
    }
    return nullptr;
}

} // namespace

void setAutoresizingMask(QWidget *view, AutoresizingMask mask)
{
    if (!view)
        return;
    if (AutoresizingFollower *follower = followerOf(view))
        follower->setMask(mask);
    else if (mask != AutoresizingMask(Autoresizing::None))
        new AutoresizingFollower(view, mask);
}

AutoresizingMask autoresizingMask(const QWidget *view)
{
    const AutoresizingFollower *follower = view ? followerOf(view) : nullptr;
    return follower ? follower->mask() : AutoresizingMask(Autoresizing::None);
}

} // namespace zaf::ui
