#include "host/demo/demo_window.h"

#include "host/demo/demo_report_view.h"
#include "host/demo/demo_scene.h"
#include "host/extension_session.h"
#include "host/input_items.h"
#include "platform/log.h"

#include <QApplication>
#include <QCloseEvent>
#include <QDateTime>
#include <QDir>
#include <QFileInfo>
#include <QJsonArray>
#include <QJsonDocument>
#include <QLoggingCategory>
#include <QPainter>
#include <QStackedLayout>

#include <cmath>
#include <cstdio>

Q_LOGGING_CATEGORY(lcDemo, "zaf.demo")

namespace zaf::demo {

// Shows the latest recorded frame, scaled to fit with bars around it.
class StageView : public QWidget {
public:
    explicit StageView(QWidget *parent = nullptr)
        : QWidget(parent)
    {
        setAttribute(Qt::WA_OpaquePaintEvent);
    }

    void setFrame(const QImage &frame)
    {
        m_frame = frame;
        update();
    }

    QSize sizeHint() const override { return QSize(960, 540); }

protected:
    void paintEvent(QPaintEvent *) override
    {
        QPainter painter(this);
        painter.fillRect(rect(), Qt::black);
        if (m_frame.isNull())
            return;
        QSize fitted = m_frame.size().scaled(size(), Qt::KeepAspectRatio);
        QRect target(QPoint(0, 0), fitted);
        target.moveCenter(rect().center());
        painter.setRenderHint(QPainter::SmoothPixmapTransform, fitted != m_frame.size());
        painter.drawImage(target, m_frame);
    }

private:
    QImage m_frame;
};

DemoWindow::DemoWindow(const DemoOptions &options, QWidget *parent)
    : QWidget(parent)
    , m_options(options)
{
    setWindowTitle(QString::fromLatin1(kDemoAppName));
    m_stage = new StageView(this);
    m_report = new DemoReportView(this);
    m_pages = new QStackedLayout(this);
    m_pages->setContentsMargins(0, 0, 0, 0);
    m_pages->addWidget(m_stage);
    m_pages->addWidget(m_report);
    setMinimumSize(640, 360);
    resize(960, 540);

    m_frameTimer.setTimerType(Qt::PreciseTimer);
    m_frameTimer.setInterval(10); // polls often; frames are due by the clock, see onFrameTick()
    connect(&m_frameTimer, &QTimer::timeout, this, &DemoWindow::onFrameTick);
    connect(m_report, &DemoReportView::recordAgainRequested, this, &DemoWindow::startRecording);
    connect(m_report, &DemoReportView::quitRequested, this, &QWidget::close);
}

DemoWindow::~DemoWindow() = default;

QString DemoWindow::recordingPath(const QString &directory)
{
    const QString stem = QStringLiteral("Zafrel Demo %1")
                             .arg(QDateTime::currentDateTime().toString(QStringLiteral("yyyy-MM-dd 'at' HH.mm.ss")));
    const QDir dir(directory);
    QString path = dir.filePath(stem + QStringLiteral(".mp4"));
    for (int n = 2; QFileInfo::exists(path); ++n)
        path = dir.filePath(QStringLiteral("%1 (%2).mp4").arg(stem).arg(n));
    return path;
}

void DemoWindow::showEvent(QShowEvent *event)
{
    QWidget::showEvent(event);
    if (!m_started) {
        m_started = true;
        QTimer::singleShot(0, this, &DemoWindow::startRecording);
    }
}

void DemoWindow::closeEvent(QCloseEvent *event)
{
    // An unfinished recording is abandoned (its temporary file removed); a running editor is ended
    // by the session's destructor.
    m_frameTimer.stop();
    m_recorder.reset();
    if (m_session && m_session->isRunning())
        m_session->removeView();
    event->accept();
}

void DemoWindow::startRecording()
{
    if (m_session)
        return; // the editor is still open
    setWindowTitle(QString::fromLatin1(kDemoAppName));
    m_reported = false;
    m_outcome = 1;

    if (!QDir().mkpath(m_options.outputDirectory)) {
        fail(QStringLiteral("Cannot record"),
             QStringLiteral("The folder %1 cannot be created.").arg(QDir::toNativeSeparators(m_options.outputDirectory)));
        return;
    }
    m_moviePath = recordingPath(m_options.outputDirectory);
    m_recorder = std::make_unique<DemoRecorder>();
    connect(m_recorder.get(), &DemoRecorder::finished, this, &DemoWindow::onRecordingFinished, Qt::QueuedConnection);
    if (OptionalError error = m_recorder->start(m_moviePath)) {
        m_recorder.reset();
        fail(QStringLiteral("Cannot record"), error->message);
        return;
    }
    const int fps = m_recorder->settings().frameRate;
    m_totalFrames = std::max<qint64>(1, std::llround(m_options.seconds * fps));
    m_nextFrame = 0;
    m_stage->setFrame(renderScene(m_recorder->settings().videoSize, SceneState{0, 0, true, m_options.seconds}));
    m_pages->setCurrentWidget(m_stage);
    zaf::log::notice(lcDemo(), QStringLiteral("Recording %1 s to %2").arg(m_options.seconds).arg(m_moviePath));
    m_clock.start();
    m_frameTimer.start();
}

void DemoWindow::onFrameTick()
{
    if (!m_recorder || m_nextFrame >= m_totalFrames)
        return;
    const DemoRecorder::Settings &settings = m_recorder->settings();
    // Frame n is due n / fps seconds after the start. The movie's timeline is the frame count, so
    // a late tick delays frames on screen but never shortens or stretches the recording; after a
    // stall the stage catches up by at most two frames a tick.
    const qint64 due = std::min(m_totalFrames, m_clock.elapsed() * settings.frameRate / 1000 + 1);
    for (int rendered = 0; m_nextFrame < due && rendered < 2; ++rendered) {
        const SceneState state{double(m_nextFrame) / settings.frameRate, m_nextFrame, true, m_options.seconds};
        const QImage frame = renderScene(settings.videoSize, state);
        if (!m_recorder->tryAppendFrame(frame)) {
            if (OptionalError error = m_recorder->error()) {
                m_frameTimer.stop();
                m_recorder.reset();
                fail(QStringLiteral("The recording failed"), error->message);
            }
            return; // the encoder is behind: this frame again at the next tick
        }
        m_stage->setFrame(frame);
        ++m_nextFrame;
    }
    if (m_nextFrame >= m_totalFrames) {
        m_frameTimer.stop();
        zaf::log::info(lcDemo(), QStringLiteral("%1 frames (%2 s) shown in %3 s")
                                     .arg(m_totalFrames)
                                     .arg(double(m_totalFrames) / settings.frameRate)
                                     .arg(m_clock.elapsed() / 1000.0));
        m_report->showProgress(QStringLiteral("Saving the recording…"), QDir::toNativeSeparators(m_moviePath));
        m_pages->setCurrentWidget(m_report);
        m_recorder->finish();
    }
}

void DemoWindow::onRecordingFinished(const QString &path, const QString &errorMessage)
{
    m_recorder.reset();
    if (!errorMessage.isEmpty()) {
        fail(QStringLiteral("The recording could not be saved"), errorMessage);
        return;
    }
    zaf::log::notice(lcDemo(), QStringLiteral("Recorded %1").arg(path));
    presentEditor(path);
}

void DemoWindow::presentEditor(const QString &moviePath)
{
    if (m_options.extensionPath.isEmpty()) {
        fail(QStringLiteral("The video editor was not found"),
             QStringLiteral("The recording is saved as %1, but the editor extension "
                            "(zaf-video-editor-extension) could not be found. %2")
                 .arg(QDir::toNativeSeparators(moviePath), m_options.extensionSearchNote));
        return;
    }
    host::RecordingDetails details;
    details.moviePath = moviePath;
    details.appName = QString::fromLatin1(kDemoAppName);
    details.bundleIdentifier = QString::fromLatin1(kDemoBundleIdentifier);
    details.shareMessage = m_options.shareMessage;
    details.tintColor = m_options.tintColor;
    QString error;
    const std::optional<QList<host::InputItem>> items = host::makeInputItems(details, &error);
    if (!items) {
        fail(QStringLiteral("The video editor could not be opened"), error);
        return;
    }

    auto *session = new host::ExtensionSession(this);
    m_session = session;
    connect(session, &host::ExtensionSession::requestAccepted, this, [this] {
        m_report->setNote(QStringLiteral("The editor has accepted the recording."));
    });
    connect(session, &host::ExtensionSession::requestRejected, this, [this](const QString &message) {
        m_report->setNote(QStringLiteral("The editor refused the recording: %1").arg(message));
    });
    connect(session, &host::ExtensionSession::protocolError, this, [](const QString &message) {
        zaf::log::error(lcDemo(), QStringLiteral("Editor channel: %1").arg(message));
    });
    connect(session, &host::ExtensionSession::activityTypesReported, this, &DemoWindow::onActivityTypesReported);
    connect(session, &host::ExtensionSession::finished, this, &DemoWindow::onEditorFinished);

    m_report->showProgress(QStringLiteral("The editor is open"),
                           QStringLiteral("Trim, save or share %1 in the Zafrel Video Editor window. "
                                          "What you do there will be listed here when you close it.")
                               .arg(QDir::toNativeSeparators(moviePath)));
    m_pages->setCurrentWidget(m_report);
    setWindowTitle(QStringLiteral("%1: Editing").arg(QString::fromLatin1(kDemoAppName)));

    if (!session->start(m_options.extensionPath, *items, &error)) {
        m_session = nullptr;
        session->deleteLater();
        fail(QStringLiteral("The video editor could not be started"),
             QStringLiteral("%1\n(%2)").arg(error, QDir::toNativeSeparators(m_options.extensionPath)));
        return;
    }
    zaf::log::notice(lcDemo(), QStringLiteral("Editor started (process %1)").arg(session->processId()));
}

void DemoWindow::onActivityTypesReported(const QStringList &activityTypes)
{
    m_reported = true;
    zaf::log::notice(lcDemo(), QStringLiteral("The editor reported: [%1]").arg(activityTypes.join(QStringLiteral(", "))));
    // The report on standard output too, as one JSON array line, for scripts driving the demo.
    const QByteArray json = QJsonDocument(QJsonArray::fromStringList(activityTypes)).toJson(QJsonDocument::Compact);
    std::fprintf(stdout, "%s\n", json.constData());
    std::fflush(stdout);
    m_report->showReport(m_moviePath, activityTypes);
    m_report->setNote(QStringLiteral("Closing the editor…"));
    if (m_session)
        m_session->removeView();
}

void DemoWindow::onEditorFinished(int exitCode, bool crashed)
{
    if (m_session) {
        m_session->deleteLater();
        m_session = nullptr;
    }
    if (!m_reported) {
        fail(crashed && exitCode > 128 ? QStringLiteral("The video editor stopped unexpectedly")
                                       : QStringLiteral("The video editor closed without a report"),
             QStringLiteral("The editor process %1 before it reported what was done. The recording is kept as %2.")
                 .arg(crashed && exitCode > 128 ? QStringLiteral("was ended by signal %1").arg(exitCode - 128)
                                                : QStringLiteral("ended with status %1").arg(exitCode),
                      QDir::toNativeSeparators(m_moviePath)));
        return;
    }
    if (crashed) {
        m_report->setNote(QStringLiteral("The editor reported, but then ended with status %1.").arg(exitCode));
        conclude(1);
        return;
    }
    m_report->setNote(QStringLiteral("The editor has closed."));
    conclude(0);
}

void DemoWindow::fail(const QString &headline, const QString &detail)
{
    zaf::log::error(lcDemo(), QStringLiteral("%1: %2").arg(headline, detail));
    m_report->showFailure(headline, detail);
    m_report->setNote(QString());
    m_pages->setCurrentWidget(m_report);
    conclude(1);
}

void DemoWindow::conclude(int outcome)
{
    m_outcome = outcome;
    setWindowTitle(QStringLiteral("%1: %2").arg(QString::fromLatin1(kDemoAppName),
                                                outcome == 0 ? QStringLiteral("Report") : QStringLiteral("Problem")));
    m_report->setActionsVisible(true);
    if (m_options.quitAfterReport) {
        QTimer::singleShot(m_options.quitDelayMs, qApp, [outcome] { QCoreApplication::exit(outcome); });
    }
}

} // namespace zaf::demo
