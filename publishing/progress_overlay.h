#pragma once

// ZafYouTubeActivityProgressOverlay: covers the publishing form while the upload runs. It dims
// everything under it, shows a spinning activity indicator in its centre, and under the indicator
// the upload's progress (a thin bar and a percentage) on a dark rounded panel. The overlay fades in
// and out over 0.2 s.
//
// Showing sets up a dimming layer with the overlay's bounds and fades the overlay in; the indicator
// and the progress display are created when that fade ends (also when another fade cut it short).
// Hiding takes the indicator away, fades the overlay out and then removes the overlay from its
// parent. The dimming layer takes the overlay's size at set-up; the indicator and the progress
// display are centred on the overlay's bounds when they are created. Main thread only.
//
// The overlay covers the form's own Cancel, so it carries a Cancel button of its own, under the
// progress, from set-up until stopActivity() or hiding: pressing it emits cancelRequested(), and
// the publishing flow cancels as the form's Cancel does.

#include "platform/ui/activity_indicator.h"

#include <QAbstractButton>
#include <QLabel>
#include <QPointer>
#include <QProgressBar>
#include <QTimer>
#include <QWidget>

#include <functional>

class ZafYouTubeActivityProgressOverlay : public QWidget {
    Q_OBJECT
public:
    // The overlay is created with its frame (normally the host view's bounds).
    explicit ZafYouTubeActivityProgressOverlay(const QRect &frame, QWidget *parent = nullptr);
    ~ZafYouTubeActivityProgressOverlay() override;

    // The one entry for showing and hiding; does nothing when `showing` is the current state. The
    // fades last 0.2 s whether or not `animated` is set.
    void setShowingAnimated(bool showing, bool animated);
    // The fade-in and the fade-out, run by setShowingAnimated.
    void setupOverlayAnimated(bool animated);
    void tearDownOverlayAnimated(bool animated);

    // Takes the indicator off the screen; the dimming and the progress display stay. Before the
    // indicator exists this does nothing.
    void stopActivity();

    // The indicator, created when the fade-in ends; null before.
    zaf::ui::ActivityIndicator *activityIndicator() const { return m_activityIndicator; }

    bool isShowing() const { return m_isShowing; }
    void setIsShowing(bool showing) { m_isShowing = showing; }

    // The upload's progress as a fraction 0..1 (clamped), or negative when the total is not known.
    // Kept until the progress display exists, which is created with the indicator.
    void setProgress(double fraction);
    double progress() const { return m_progress; }
    // The progress display: null until the indicator has been created.
    QProgressBar *progressBar() const { return m_progressBar; }
    QLabel *progressLabel() const { return m_progressLabel; }
    // The text the percentage label shows for a fraction, rounded down and written as the user's
    // locale writes percentages ("42%", "42 %"); empty when unknown.
    static QString progressText(double fraction);

    // The dimming child made at set-up; null before.
    QWidget *dimmingView() const { return m_dimmingView; }
    // The Cancel button made at set-up (null before); hidden once the activity stops.
    QAbstractButton *cancelButton() const { return m_cancelButton; }

Q_SIGNALS:
    // Main thread: the overlay's Cancel was pressed.
    void cancelRequested();

public:

    static constexpr double kFadeSeconds = 0.2;
    static constexpr double kDimmingAlpha = 0.5;
    // Space between the indicator and the progress display, and the display's size, in points.
    static constexpr int kProgressSpacing = 12;
    static constexpr int kProgressBarWidth = 120;
    static constexpr int kProgressBarHeight = 4;
    static constexpr int kProgressPanelPadding = 16;
    // From the overlay's centre down to the top of the Cancel button, in points.
    static constexpr int kCancelButtonOffset = 64;

private:
    // Fades the overlay to `alpha` over kFadeSeconds, then runs `completion`. A fade started while
    // another one runs cuts that one short: its completion runs at once, as at any animation's end.
    void fadeTo(double alpha, std::function<void()> completion);
    void finishPendingFade();
    void createActivityIndicator();
    void createCancelButton();
    void hideCancelButton();
    void applyProgress();

    bool m_isShowing = false;
    double m_progress = -1.0;
    QPointer<QWidget> m_dimmingView;
    QPointer<zaf::ui::ActivityIndicator> m_activityIndicator;
    QPointer<QWidget> m_progressPanel;   // the rounded backing behind indicator, bar and text
    QPointer<QProgressBar> m_progressBar;
    QPointer<QLabel> m_progressLabel;
    QPointer<QAbstractButton> m_cancelButton;
    QTimer m_fadeTimer;
    std::function<void()> m_fadeCompletion;
};
