#pragma once

// ActivityIndicator: the spinning "work in progress" widget. A ring of arcs turns while the
// indicator animates; a stopped indicator draws nothing. The rotation is driven by a timer that runs
// only while the indicator is both animating and visible, so an indicator that was taken off the
// screen costs nothing. The owner places it by its centre (setCenter); its size comes from its style.
// Main thread only.

#include <QElapsedTimer>
#include <QPoint>
#include <QSize>
#include <QTimer>
#include <QWidget>

namespace zaf::ui {

class ActivityIndicator : public QWidget {
    Q_OBJECT
public:
    // Styles, numbered as the callers store them.
    enum Style {
        LargeWhite = 0,   // 37x37 points, white arcs: over dimmed or dark content
        White = 1,        // 20x20 points, white arcs
        Gray = 2,         // 20x20 points, gray arcs: over light content
    };

    explicit ActivityIndicator(int style = LargeWhite, QWidget *parent = nullptr);
    ~ActivityIndicator() override;

    int style() const { return m_style; }
    // The size the style draws at, in points (device-independent pixels).
    static QSize sizeForStyle(int style);
    // The colour of the arcs for the style.
    static QColor colorForStyle(int style);

    void startAnimating();
    void stopAnimating();
    bool isAnimating() const { return m_animating; }

    // Moves the indicator so that its centre is `center` (in its parent's coordinates), at the
    // style's size.
    void setCenter(const QPointF &center);
    QPointF center() const;

    // The current rotation in degrees [0, 360), and whether the rotation timer runs right now.
    double rotation() const { return m_rotation; }
    bool isRotationTimerActive() const { return m_timer.isActive(); }

    // One revolution takes this long.
    static constexpr int kRevolutionMs = 1000;
    // The rotation is advanced this often.
    static constexpr int kFrameIntervalMs = 16;
    // Number of arcs in the ring.
    static constexpr int kArcCount = 8;

    QSize sizeHint() const override;
    QSize minimumSizeHint() const override;

protected:
    void paintEvent(QPaintEvent *event) override;
    void showEvent(QShowEvent *event) override;
    void hideEvent(QHideEvent *event) override;

private:
    void updateTimer();
    void advance();

    int m_style = LargeWhite;
    bool m_animating = false;
    double m_rotation = 0.0;
    QTimer m_timer;
    QElapsedTimer m_clock;
};

} // namespace zaf::ui
