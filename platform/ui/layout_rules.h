#pragma once

// Geometry rules that stand in for layout constraints: item1.attribute1 = item2.attribute2 *
// multiplier + constant, or item1.attribute1 = constant. The rules of a view are recomputed on every
// layout pass of that view (its resize, or an explicit layoutIfNeeded), in the order they were
// added, so that no stale geometry survives; a later rule on the same attribute of an item wins.
// A rule whose second item is not (or no longer) inside the view is skipped: removed with
// removeFromSuperview (view_animation.h), reparented elsewhere or destroyed. Per item, the rules
// fix attributes of each axis and the rest of the frame is kept (leading + trailing give x and width,
// leading alone moves the item, width alone resizes it). Adding, retiring or re-adding rules lays
// the view out on the next pass of the event loop; an equal rule added again replaces its earlier
// copy, so repeated layout passes do not pile rules up. Main thread only.

#include <QList>
#include <QObject>
#include <QPointer>
#include <QWidget>

namespace zaf::ui {

enum class LayoutAttribute { Leading, Trailing, Top, Bottom, Width, Height, CenterX, CenterY };

struct LayoutRule {
    QPointer<QWidget> item1;
    LayoutAttribute attribute1;
    QPointer<QWidget> item2;         // null: the rule sets a constant
    LayoutAttribute attribute2 = LayoutAttribute::Leading;
    double multiplier = 1.0;
    double constant = 0.0;
    QByteArray group;                // a name to retire rules together
};

class LayoutRules : public QObject {
    Q_OBJECT
public:
    // The rule set of a view (made on first use; lives as long as the view).
    static LayoutRules *forView(QWidget *view);
    // The rule set of a view if it has one, else null (never makes one).
    static LayoutRules *existingForView(const QWidget *view);

    void addRule(const LayoutRule &rule);
    void addRules(const QList<LayoutRule> &rules);
    // Retires every rule of a group, or every rule that names an item.
    void removeRulesInGroup(const QByteArray &group);
    void removeRulesFor(const QWidget *item);
    QList<LayoutRule> rules() const;

    // Applies the rules now.
    void layoutIfNeeded();

protected:
    bool eventFilter(QObject *watched, QEvent *event) override;

private:
    struct Entry {
        LayoutRule rule;
        bool hasItem2;   // a second item was named (it may have been destroyed since)
    };
    explicit LayoutRules(QWidget *view);
    void scheduleLayout();
    QWidget *m_view;
    QList<Entry> m_rules;
    bool m_layoutScheduled = false;
};

} // namespace zaf::ui
