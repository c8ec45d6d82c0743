#pragma once

// Toolbar: a bar of BarButtonItems, set whole (every change sets the full ordered list). The same
// space item may appear several times in one list; each occurrence gets its own spacer. A custom
// item's widget lives in the toolbar that shows it last, centred at its own size. The bar is a light,
// slightly translucent strip; its height is the caller's (the frame), items are vertically centred.
// An item's changes (width, insets, enabled state, tooltip) show at once. Main thread only.

#include <QColor>
#include <QList>
#include <QWidget>

#include <memory>

namespace zaf::ui {

class BarButtonItem;

class Toolbar : public QWidget {
    Q_OBJECT
public:
    explicit Toolbar(QWidget *parent = nullptr);
    ~Toolbar() override;

    // Replaces the whole list; the change shows at once (`animated` is accepted but not animated).
    // Safe to call from the action of an item of this toolbar.
    void setItems(const QList<BarButtonItem *> &items, bool animated = false);
    QList<BarButtonItem *> items() const;

    // The colour of the items' texts and monochrome (symbolic) icons; invalid: the palette's
    // button text colour and the icons' own colours.
    void setTintColor(const QColor &color);
    QColor tintColor() const;

    // The toolbar's delegate (kept for the editor's wiring; it implements no optional operation).
    void setDelegate(QObject *delegate);
    QObject *delegate() const;

    // The widget that shows an item's occurrence (index in items()), for tests and screenshots.
    QWidget *widgetForItemAt(int index) const;

protected:
    void paintEvent(QPaintEvent *event) override;

private:
    void itemChanged(BarButtonItem *item);
    struct Private;
    std::unique_ptr<Private> d;
};

} // namespace zaf::ui
