#pragma once

// The demo recorder's animated scene: a pure function of the timeline position.
//
// Everything on the stage (the bouncing ball, the orbiting tiles, the clock, the progress bar and
// the recording badge) is computed from the time alone, so a frame can be rendered anywhere (on
// the main thread for the window, in a test without any window) and always looks the same for the
// same time. The soundtrack reads the same beat and ball position so that sound follows picture.

#include <QColor>
#include <QImage>
#include <QPointF>
#include <QSize>

class QPainter;

namespace zaf::demo {

// The scene's rhythm: the ball lands once per beat, and every landing plays the next note.
inline constexpr double kBeatSeconds = 0.5;
// Notes of the melody, one per beat, cycling (semitones above A3).
inline constexpr int kMelodyLength = 16;
int melodySemitone(qint64 beat);
double melodyFrequency(qint64 beat);
// The colour the ball takes for a beat's note.
QColor noteColour(qint64 beat);

// The ball's centre at `seconds`, in stage units: x and y in [0, 1], y = 1 on the floor.
QPointF ballPosition(double seconds);

struct SceneState {
    double seconds = 0;        // timeline position
    qint64 frameNumber = 0;    // shown in the corner, so single frames can be told apart
    bool recording = false;    // draws the pulsing "Recording" badge with the elapsed time
    double totalSeconds = 0;   // length of the recording, for the progress bar (0: no bar)
};

// Paints the scene into `size` (logical pixels) with `painter`.
void paintScene(QPainter &painter, const QSize &size, const SceneState &state);

// Renders one frame of the scene into a new RGB32 image of `size`.
QImage renderScene(const QSize &size, const SceneState &state);

} // namespace zaf::demo
