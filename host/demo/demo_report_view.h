#pragma once

// The demo recorder's second page: what happened to the recording after it was made.
//
// It shows one of three states: work in progress (saving the movie, the editor being open), the
// editor's report (each activity type the user carried out, in plain words and in order), or a
// failure. "Record again" and "Quit" are offered once nothing is running any more.
//
// Threads: main thread only.

#include <QStringList>
#include <QWidget>

class QLabel;
class QListWidget;
class QPushButton;

namespace zaf::demo {

// An activity type in plain words: "Saved to Videos" for the save to the video library, the
// share activities by name, anything unknown from the words of its identifier.
QString describeActivityType(const QString &activityType);

class DemoReportView : public QWidget {
    Q_OBJECT
public:
    explicit DemoReportView(QWidget *parent = nullptr);

    // A step in progress: a headline and a line of detail; the buttons are hidden.
    void showProgress(const QString &headline, const QString &detail);
    // The editor's report for the movie at `moviePath`.
    void showReport(const QString &moviePath, const QStringList &activityTypes);
    // Something went wrong; `detail` says what.
    void showFailure(const QString &headline, const QString &detail);
    // Adds a line under the current state (for example that the editor has closed).
    void setNote(const QString &note);
    // Shows or hides "Record again" and "Quit".
    void setActionsVisible(bool visible);

    bool hasReport() const { return m_hasReport; }

Q_SIGNALS:
    void recordAgainRequested();
    void quitRequested();

private:
    QLabel *m_headline = nullptr;
    QLabel *m_detail = nullptr;
    QListWidget *m_activities = nullptr;
    QLabel *m_note = nullptr;
    QPushButton *m_recordAgain = nullptr;
    QPushButton *m_quit = nullptr;
    bool m_hasReport = false;
};

} // namespace zaf::demo
