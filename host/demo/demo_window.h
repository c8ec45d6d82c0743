#pragma once

// The demo recorder's window: records itself for a few seconds, then presents the video editor on
// the recording the way a real recording application does, and shows what the editor reported.
//
// Sequence: recording (the animated stage, one frame every 1/30 s on the main thread's timer,
// encoded by a DemoRecorder on its worker) -> saving (the recorder completes the movie) -> editing
// (an ExtensionSession runs the editor extension on the movie) -> report (the activity types the
// user carried out; the editor's view is removed) -> done (once the extension process has exited:
// "Record again" or "Quit"). A failure at any step ends in a message instead.
//
// Threads: main thread only. The recorder's finished() arrives through a queued connection.

#include "host/demo/demo_recorder.h"

#include <QElapsedTimer>
#include <QImage>
#include <QPointer>
#include <QString>
#include <QTimer>
#include <QWidget>

#include <memory>
#include <optional>

class QStackedLayout;

namespace zaf::host {
class ExtensionSession;
}

namespace zaf::demo {

class DemoReportView;
class StageView;

struct DemoOptions {
    double seconds = 6;            // length of each recording
    QString outputDirectory;       // where recordings go; created when missing
    QString extensionPath;         // the editor extension's executable (empty: not found)
    QString extensionSearchNote;   // where it was looked for, for the message when not found
    std::optional<QString> shareMessage;
    QString tintColor = QStringLiteral("#E0457B");
    bool quitAfterReport = false;  // non-interactive runs: quit a few seconds after the outcome
    int quitDelayMs = 4000;
};

inline constexpr char kDemoAppName[] = "Zafrel Demo Recorder";
inline constexpr char kDemoBundleIdentifier[] = "com.zafrel.DemoRecorder";

class DemoWindow : public QWidget {
    Q_OBJECT
public:
    explicit DemoWindow(const DemoOptions &options, QWidget *parent = nullptr);
    ~DemoWindow() override;

    // The process exit status a non-interactive run ends with: 0 once the editor has reported and
    // exited cleanly, 1 after any failure.
    int outcome() const { return m_outcome; }

    // A file name for a recording made at the current time, unique in `directory`.
    static QString recordingPath(const QString &directory);

protected:
    void showEvent(QShowEvent *event) override;
    void closeEvent(QCloseEvent *event) override;

private:
    void startRecording();
    void onFrameTick();
    void onRecordingFinished(const QString &path, const QString &errorMessage);
    void presentEditor(const QString &moviePath);
    void onActivityTypesReported(const QStringList &activityTypes);
    void onEditorFinished(int exitCode, bool crashed);
    void fail(const QString &headline, const QString &detail);
    void conclude(int outcome);

    DemoOptions m_options;
    QStackedLayout *m_pages = nullptr;
    StageView *m_stage = nullptr;
    DemoReportView *m_report = nullptr;

    std::unique_ptr<DemoRecorder> m_recorder;
    QTimer m_frameTimer;
    QElapsedTimer m_clock;
    qint64 m_nextFrame = 0;
    qint64 m_totalFrames = 0;
    QString m_moviePath;

    QPointer<host::ExtensionSession> m_session;
    bool m_reported = false;
    bool m_started = false;
    int m_outcome = 1;
};

} // namespace zaf::demo
