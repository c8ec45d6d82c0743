#include "host/demo/demo_report_view.h"

#include <QDir>
#include <QFileInfo>
#include <QHBoxLayout>
#include <QHash>
#include <QLabel>
#include <QListWidget>
#include <QPushButton>
#include <QRegularExpression>
#include <QVBoxLayout>

namespace zaf::demo {

namespace {

// The words of an identifier's last part: "org.example.activity.PostToSocial" -> "Post to social".
QString wordsOf(const QString &identifier)
{
    QString last = identifier.section(QLatin1Char('.'), -1);
    if (last.isEmpty())
        last = identifier;
    static const QRegularExpression prefix(QStringLiteral("^(Zaf|ActivityType)(?=[A-Z])"));
    last.remove(prefix);
    // Split at underscores, hyphens and at every capital that starts a new word ("PDFExport" gives
    // "PDF", "Export").
    static const QRegularExpression boundary(QStringLiteral("[_\\-\\s]+|(?<=[a-z0-9])(?=[A-Z])|(?<=[A-Z])(?=[A-Z][a-z])"));
    static const QStringList minorWords = {QStringLiteral("to"), QStringLiteral("in"), QStringLiteral("on"),
                                           QStringLiteral("by"), QStringLiteral("with"), QStringLiteral("a"),
                                           QStringLiteral("an"), QStringLiteral("the"), QStringLiteral("of"),
                                           QStringLiteral("for"), QStringLiteral("and"), QStringLiteral("as")};
    QStringList words = last.split(boundary, Qt::SkipEmptyParts);
    for (int i = 0; i < words.size(); ++i) {
        if (i > 0 && minorWords.contains(words[i], Qt::CaseInsensitive))
            words[i] = words[i].toLower();
        else if (i == 0)
            words[i][0] = words[i][0].toUpper();
    }
    return words.isEmpty() ? identifier : words.join(QLatin1Char(' '));
}

} // namespace

QString describeActivityType(const QString &activityType)
{
    static const QHash<QString, QString> known = {
        {QStringLiteral("com.zafrel.activity.SaveToPhotoLibrary"), QStringLiteral("Saved to Videos")},
        {QStringLiteral("ZafPublishToYouTube"), QStringLiteral("Published to YouTube")},
        {QStringLiteral("com.zafrel.activity.Mail"), QStringLiteral("Sent by email")},
        {QStringLiteral("com.zafrel.activity.Message"), QStringLiteral("Sent as a message")},
        {QStringLiteral("com.zafrel.activity.CopyToClipboard"), QStringLiteral("Copied to the clipboard")},
        {QStringLiteral("com.zafrel.activity.OpenWith"), QStringLiteral("Opened in another application")},
        {QStringLiteral("com.zafrel.activity.SaveToFolder"), QStringLiteral("Saved to a folder")},
    };
    const auto it = known.constFind(activityType);
    if (it != known.constEnd())
        return it.value();
    if (activityType.trimmed().isEmpty())
        return QStringLiteral("An unnamed action");
    return wordsOf(activityType.trimmed());
}

DemoReportView::DemoReportView(QWidget *parent)
    : QWidget(parent)
{
    setAutoFillBackground(true);
    QPalette pal = palette();
    pal.setColor(QPalette::Window, QColor(28, 30, 38));
    pal.setColor(QPalette::WindowText, QColor(235, 236, 240));
    pal.setColor(QPalette::Base, QColor(38, 41, 52));
    pal.setColor(QPalette::Text, QColor(235, 236, 240));
    setPalette(pal);

    m_headline = new QLabel(this);
    QFont headlineFont = m_headline->font();
    headlineFont.setPixelSize(28);
    headlineFont.setBold(true);
    m_headline->setFont(headlineFont);
    m_headline->setWordWrap(true);

    m_detail = new QLabel(this);
    QFont detailFont = m_detail->font();
    detailFont.setPixelSize(16);
    m_detail->setFont(detailFont);
    m_detail->setWordWrap(true);
    m_detail->setTextInteractionFlags(Qt::TextSelectableByMouse);

    m_activities = new QListWidget(this);
    QFont listFont = m_activities->font();
    listFont.setPixelSize(20);
    m_activities->setFont(listFont);
    m_activities->setFocusPolicy(Qt::NoFocus);
    m_activities->setSelectionMode(QAbstractItemView::NoSelection);
    m_activities->setSpacing(4);
    m_activities->hide();

    m_note = new QLabel(this);
    m_note->setFont(detailFont);
    m_note->setWordWrap(true);
    QPalette notePalette = m_note->palette();
    notePalette.setColor(QPalette::WindowText, QColor(160, 165, 180));
    m_note->setPalette(notePalette);

    m_recordAgain = new QPushButton(QStringLiteral("Record again"), this);
    m_quit = new QPushButton(QStringLiteral("Quit"), this);
    m_recordAgain->setMinimumSize(160, 40);
    m_quit->setMinimumSize(120, 40);
    m_recordAgain->setDefault(true);
    connect(m_recordAgain, &QPushButton::clicked, this, &DemoReportView::recordAgainRequested);
    connect(m_quit, &QPushButton::clicked, this, &DemoReportView::quitRequested);

    auto *buttons = new QHBoxLayout;
    buttons->addStretch(1);
    buttons->addWidget(m_quit);
    buttons->addWidget(m_recordAgain);

    auto *layout = new QVBoxLayout(this);
    layout->setContentsMargins(48, 40, 48, 32);
    layout->setSpacing(16);
    layout->addWidget(m_headline);
    layout->addWidget(m_detail);
    layout->addWidget(m_activities, 1);
    layout->addStretch(0);
    layout->addWidget(m_note);
    layout->addLayout(buttons);
    setActionsVisible(false);
}

void DemoReportView::showProgress(const QString &headline, const QString &detail)
{
    m_hasReport = false;
    m_headline->setText(headline);
    m_detail->setText(detail);
    m_activities->clear();
    m_activities->hide();
    m_note->clear();
    setActionsVisible(false);
}

void DemoReportView::showReport(const QString &moviePath, const QStringList &activityTypes)
{
    m_hasReport = true;
    m_headline->setText(QStringLiteral("The editor has finished"));
    const QString where = QDir::toNativeSeparators(QFileInfo(moviePath).absoluteFilePath());
    if (activityTypes.isEmpty()) {
        m_detail->setText(QStringLiteral("Recording: %1").arg(where));
    } else {
        m_detail->setText(QStringLiteral("What was done with the recording %1, in order:").arg(where));
    }
    m_activities->clear();
    if (activityTypes.isEmpty()) {
        auto *item = new QListWidgetItem(QStringLiteral("Nothing was done"), m_activities);
        item->setToolTip(QStringLiteral("The editor reported no activity."));
    } else {
        int n = 0;
        for (const QString &type : activityTypes) {
            auto *item = new QListWidgetItem(QStringLiteral("%1.  %2").arg(++n).arg(describeActivityType(type)), m_activities);
            item->setToolTip(type);
        }
    }
    m_activities->show();
}

void DemoReportView::showFailure(const QString &headline, const QString &detail)
{
    m_hasReport = false;
    m_headline->setText(headline);
    m_detail->setText(detail);
    m_activities->clear();
    m_activities->hide();
}

void DemoReportView::setNote(const QString &note)
{
    m_note->setText(note);
}

void DemoReportView::setActionsVisible(bool visible)
{
    m_recordAgain->setVisible(visible);
    m_quit->setVisible(visible);
    if (visible)
        m_recordAgain->setFocus();
}

} // namespace zaf::demo
