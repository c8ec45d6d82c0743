#include "platform/ui/layout_rules.h"

#include "platform/ui/view_animation.h"

#include <QEvent>
#include <QTimer>

#include <array>
#include <cmath>
#include <optional>

namespace zaf::ui {

namespace {

constexpr const char *kRulesProperty = "_zaf_layoutRules";

bool sameRule(const LayoutRule &a, const LayoutRule &b)
{
    return a.item1 == b.item1 && a.attribute1 == b.attribute1 && a.item2 == b.item2
        && (!a.item2 || a.attribute2 == b.attribute2) && a.multiplier == b.multiplier
        && a.constant == b.constant && a.group == b.group;
}

// Whether `item` is the view or shown inside it: every view from the item up to the view is still
// in its superview (removeFromSuperview takes a view out).
bool isInside(const QWidget *item, const QWidget *view)
{
    if (!item)
        return false;
    for (const QWidget *w = item; w; w = superview(w)) {
        if (w == view)
            return true;
    }
    return false;
}

// An item's frame in the coordinates of the view the rules belong to.
QRectF frameInView(const QWidget *item, const QWidget *view)
{
    if (item == view)
        return QRectF(QPointF(0, 0), QSizeF(view->size()));
    return QRectF(QPointF(item->mapTo(view, QPoint(0, 0))), QSizeF(item->size()));
}

double valueOf(const QRectF &frame, LayoutAttribute attribute)
{
    switch (attribute) {
    case LayoutAttribute::Leading: return frame.left();
    case LayoutAttribute::Trailing: return frame.left() + frame.width();
    case LayoutAttribute::Top: return frame.top();
    case LayoutAttribute::Bottom: return frame.top() + frame.height();
    case LayoutAttribute::Width: return frame.width();
    case LayoutAttribute::Height: return frame.height();
    case LayoutAttribute::CenterX: return frame.center().x();
    case LayoutAttribute::CenterY: return frame.center().y();
    }
    return 0.0;
}

// Solves one axis from the attributes that rules fixed on it. `start`/`length` come in as the
// current values and keep whatever no rule fixes.
void solveAxis(std::optional<double> lead, std::optional<double> trail, std::optional<double> size,
               std::optional<double> center, double &start, double &length)
{
    if (lead && trail) {
        start = *lead;
        length = *trail - *lead;
    } else if (lead && size) {
        start = *lead;
        length = *size;
    } else if (trail && size) {
        length = *size;
        start = *trail - length;
    } else if (center && size) {
        length = *size;
        start = *center - length / 2;
    } else if (lead && center) {
        start = *lead;
        length = 2 * (*center - *lead);
    } else if (trail && center) {
        length = 2 * (*trail - *center);
        start = *trail - length;
    } else if (lead) {
        start = *lead;
    } else if (trail) {
        start = *trail - length;
    } else if (size) {
        length = *size;
    } else if (center) {
        start = *center - length / 2;
    }
    length = std::max(0.0, length);
}

} // namespace

LayoutRules::LayoutRules(QWidget *view) : QObject(view), m_view(view)
{
    view->installEventFilter(this);
}

LayoutRules *LayoutRules::forView(QWidget *view)
{
    if (!view)
        return nullptr;
    if (auto *rules = existingForView(view))
        return rules;
    auto *rules = new LayoutRules(view);
    view->setProperty(kRulesProperty, QVariant::fromValue<QObject *>(rules));
    return rules;
}

LayoutRules *LayoutRules::existingForView(const QWidget *view)
{
    if (!view)
        return nullptr;
    return qobject_cast<LayoutRules *>(view->property(kRulesProperty).value<QObject *>());
}

void LayoutRules::addRule(const LayoutRule &rule)
{
    if (!rule.item1)
        return;
    // An equal rule added again replaces the earlier copy: only the last copy could ever win.
    m_rules.removeIf([&](const Entry &existing) { return sameRule(existing.rule, rule); });
    m_rules.append(Entry{rule, !rule.item2.isNull()});
    scheduleLayout();
}

void LayoutRules::addRules(const QList<LayoutRule> &rules)
{
    for (const LayoutRule &rule : rules)
        addRule(rule);
}

void LayoutRules::removeRulesInGroup(const QByteArray &group)
{
    if (m_rules.removeIf([&](const Entry &entry) { return entry.rule.group == group; }) > 0)
        scheduleLayout();
}

void LayoutRules::removeRulesFor(const QWidget *item)
{
    if (m_rules.removeIf([&](const Entry &entry) {
            return entry.rule.item1 == item || entry.rule.item2 == item;
        }) > 0)
        scheduleLayout();
}

QList<LayoutRule> LayoutRules::rules() const
{
    QList<LayoutRule> rules;
    rules.reserve(m_rules.size());
    for (const Entry &entry : m_rules)
        rules.append(entry.rule);
    return rules;
}

void LayoutRules::scheduleLayout()
{
    if (m_layoutScheduled)
        return;
    m_layoutScheduled = true;
    QTimer::singleShot(0, this, [this] {
        if (m_layoutScheduled)
            layoutIfNeeded();
    });
}

void LayoutRules::layoutIfNeeded()
{
    m_layoutScheduled = false;
    // Rules whose first item is gone can never apply again.
    m_rules.removeIf([](const Entry &entry) { return entry.rule.item1.isNull(); });

    // Items are placed in the order of their first rule; each item's attributes are collected
    // from its rules in order (a later rule on the same attribute wins), then solved per axis.
    QList<QWidget *> items;
    for (const Entry &entry : std::as_const(m_rules)) {
        if (!items.contains(entry.rule.item1.data()))
            items.append(entry.rule.item1.data());
    }
    for (QWidget *item : std::as_const(items)) {
        if (item == m_view || !isInside(item, m_view))
            continue;
        std::array<std::optional<double>, 8> values;
        for (const Entry &entry : std::as_const(m_rules)) {
            const LayoutRule &rule = entry.rule;
            if (rule.item1 != item)
                continue;
            double value = rule.constant;
            if (entry.hasItem2) {
                if (!isInside(rule.item2, m_view))
                    continue;   // the second item left the view: the rule is dormant
                value = valueOf(frameInView(rule.item2, m_view), rule.attribute2) * rule.multiplier + rule.constant;
            }
            values[size_t(rule.attribute1)] = value;
        }
        const QRectF current = frameInView(item, m_view);
        double x = current.x(), width = current.width(), y = current.y(), height = current.height();
        solveAxis(values[size_t(LayoutAttribute::Leading)], values[size_t(LayoutAttribute::Trailing)],
                  values[size_t(LayoutAttribute::Width)], values[size_t(LayoutAttribute::CenterX)], x, width);
        solveAxis(values[size_t(LayoutAttribute::Top)], values[size_t(LayoutAttribute::Bottom)],
                  values[size_t(LayoutAttribute::Height)], values[size_t(LayoutAttribute::CenterY)], y, height);
        QPoint topLeft(int(std::lround(x)), int(std::lround(y)));
        if (QWidget *parent = item->parentWidget(); parent && parent != m_view)
            topLeft = parent->mapFrom(m_view, topLeft);
        item->setGeometry(QRect(topLeft, QSize(int(std::lround(width)), int(std::lround(height)))));
    }
}

bool LayoutRules::eventFilter(QObject *watched, QEvent *event)
{
    if (watched == m_view && event->type() == QEvent::Resize)
        layoutIfNeeded();
    return QObject::eventFilter(watched, event);
}

} // namespace zaf::ui
