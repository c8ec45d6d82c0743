#pragma once

// BackdropView: a live, blurred and tinted copy of what lies behind it in its window (the video,
// mostly), refreshed as that content changes. Mask views shape it: a registered mask view's opaque
// pixels (with the background-mask flag) cut the backdrop away, leaving its shape; glyph-flagged mask views cut
// their shape out of the tint. Main thread only.
//
// How: about 15 times a second while shown (and at once after a show, move or resize), the window's
// content behind the view (its ancestors' backgrounds and the siblings stacked below, never the
// view, its children or what lies above) is rendered at a quarter of its size, box-blurred and kept;
// painting scales it up and lays the style's tint over it. An unchanged picture is not repainted.
// Mask views keep their place and size but are not drawn themselves: their pixels (grabbed with
// their children) are the masks. A view counts as a mask once it has flags and was added here;
// adding it gives it a graphics effect that keeps it off the screen (so it cannot also take an
// alpha through setAlpha; fade its parent instead). Masks are grabbed at every paint.

#include <QImage>
#include <QList>
#include <QPixmap>
#include <QPointer>
#include <QWidget>

#include <memory>

class QPainter;

namespace zaf::ui {

class BackdropView : public QWidget {
    Q_OBJECT
public:
    // Styles: numbered looks (tint and blur radius). 2010 is the translucent light blur of the
    // timeline and the overlay button; unknown numbers use it too.
    explicit BackdropView(int style, QWidget *parent = nullptr);
    ~BackdropView() override;
    int style() const;

    // Mask flags of a view (bit set): 1 | 2 | 4 = background mask, 1 | 2 = glyph.
    static void setBackdropMaskFlags(QWidget *view, int flags);
    static int backdropMaskFlags(const QWidget *view);
    void addMaskView(QWidget *view);
    QList<QWidget *> maskViews() const;

    // The blurred picture last rendered, before tint and masks, at reduced size (for tests).
    QImage lastRenderedBackground() const;
    // Renders what lies behind now (the timer does it while the view is shown).
    void refresh();

protected:
    void paintEvent(QPaintEvent *event) override;
    bool eventFilter(QObject *watched, QEvent *event) override;
    void showEvent(QShowEvent *event) override;
    void hideEvent(QHideEvent *event) override;
    void resizeEvent(QResizeEvent *event) override;
    void moveEvent(QMoveEvent *event) override;

private:
    void renderBehind(QPainter &painter, const QRect &area);
    void scheduleRefresh();
    QPoint positionOf(const QWidget *view) const;
    QPixmap grabMask(QWidget *view);
    struct Private;
    std::unique_ptr<Private> d;
};

} // namespace zaf::ui
