#include "publishing/progress_overlay.h"

#include "platform/text/percent_format.h"
#include "platform/ui/activity_indicator.h"
#include "platform/ui/view_animation.h"

#include <QDialogButtonBox>
#include <QLabel>
#include <QPushButton>
#include <QPainter>
#include <QPalette>
#include <QProgressBar>

#include <algorithm>
#include <cmath>
#include <utility>

namespace {

constexpr int kProgressSteps = 1000;
constexpr int kLabelHeight = 20;

// A dark rounded panel, so the progress reads clearly over whatever form field lies under it.
class ProgressPanel : public QWidget {
public:
    using QWidget::QWidget;

protected:
    void paintEvent(QPaintEvent *) override
    {
        QPainter painter(this);
        painter.setRenderHint(QPainter::Antialiasing);
        painter.setPen(Qt::NoPen);
        painter.setBrush(QColor(30, 30, 30, 220));
        painter.drawRoundedRect(QRectF(rect()), 10, 10);
    }
};

} // namespace

ZafYouTubeActivityProgressOverlay::ZafYouTubeActivityProgressOverlay(const QRect &frame, QWidget *parent)
    : QWidget(parent)
{
    setGeometry(frame);
    m_fadeTimer.setSingleShot(true);
    m_fadeTimer.setInterval(int(std::lround(kFadeSeconds * 1000.0)));
    connect(&m_fadeTimer, &QTimer::timeout, this, &ZafYouTubeActivityProgressOverlay::finishPendingFade);
}

ZafYouTubeActivityProgressOverlay::~ZafYouTubeActivityProgressOverlay()
{
    // A completion left over would touch a half-destroyed overlay.
    m_fadeTimer.stop();
    m_fadeCompletion = nullptr;
}

void ZafYouTubeActivityProgressOverlay::setShowingAnimated(bool showing, bool animated)
{
    if (showing == m_isShowing)
        return;
    m_isShowing = showing;
    if (showing)
        setupOverlayAnimated(animated);
    else
        tearDownOverlayAnimated(animated);
}

void ZafYouTubeActivityProgressOverlay::setupOverlayAnimated(bool)
{
    auto *dimming = new QWidget(this);
    dimming->setObjectName(QStringLiteral("progressOverlayDimming"));
    dimming->setGeometry(rect());
    dimming->setAutoFillBackground(true);
    QPalette palette = dimming->palette();
    QColor black = QColor::fromRgbF(0.0f, 0.0f, 0.0f);
    black.setAlphaF(float(kDimmingAlpha));
    palette.setColor(QPalette::Window, black);
    dimming->setPalette(palette);
    zaf::ui::addSubview(this, dimming);
    m_dimmingView = dimming;

    createCancelButton();

    zaf::ui::setAlpha(this, 0.0);
    QPointer<ZafYouTubeActivityProgressOverlay> self(this);
    fadeTo(1.0, [self] {
        if (self)
            self->createActivityIndicator();
    });
}

void ZafYouTubeActivityProgressOverlay::tearDownOverlayAnimated(bool)
{
    hideCancelButton();
    if (m_activityIndicator)
        zaf::ui::removeFromSuperview(m_activityIndicator);
    QPointer<ZafYouTubeActivityProgressOverlay> self(this);
    fadeTo(0.0, [self] {
        if (self)
            zaf::ui::removeFromSuperview(self);
    });
}

void ZafYouTubeActivityProgressOverlay::stopActivity()
{
    // Publishing has ended: what follows is the result alert's to decide.
    hideCancelButton();
    if (m_activityIndicator)
        zaf::ui::removeFromSuperview(m_activityIndicator);
}

void ZafYouTubeActivityProgressOverlay::createCancelButton()
{
    if (m_cancelButton) {
        m_cancelButton->show();
        m_cancelButton->raise();
        return;
    }
    // Qt's standard Cancel button, with its translated text.
    QDialogButtonBox standard(QDialogButtonBox::Cancel);
    auto *button = new QPushButton(standard.button(QDialogButtonBox::Cancel)->text(), this);
    button->setObjectName(QStringLiteral("progressOverlayCancel"));
    button->adjustSize();
    button->move(int(std::lround(width() / 2.0 - button->width() / 2.0)), height() / 2 + kCancelButtonOffset);
    connect(button, &QPushButton::clicked, this, &ZafYouTubeActivityProgressOverlay::cancelRequested);
    zaf::ui::addSubview(this, button);
    m_cancelButton = button;
}

void ZafYouTubeActivityProgressOverlay::hideCancelButton()
{
    if (m_cancelButton)
        m_cancelButton->hide();
}

void ZafYouTubeActivityProgressOverlay::fadeTo(double alpha, std::function<void()> completion)
{
    // The fade being replaced ends here, unfinished; its completion still runs.
    finishPendingFade();
    zaf::ui::animate(kFadeSeconds, [this, alpha] { zaf::ui::setAlpha(this, alpha); });
    m_fadeCompletion = std::move(completion);
    m_fadeTimer.start();
}

void ZafYouTubeActivityProgressOverlay::finishPendingFade()
{
    m_fadeTimer.stop();
    if (auto completion = std::exchange(m_fadeCompletion, nullptr))
        completion();
}

void ZafYouTubeActivityProgressOverlay::createActivityIndicator()
{
    // A second indicator would leave the first one orphaned on screen.
    if (m_activityIndicator) {
        zaf::ui::removeFromSuperview(m_activityIndicator);
        m_activityIndicator->deleteLater();
    }
    auto *indicator = new zaf::ui::ActivityIndicator(zaf::ui::ActivityIndicator::LargeWhite, this);
    m_activityIndicator = indicator;
    indicator->startAnimating();
    const QPointF centre(width() / 2.0, height() / 2.0);
    indicator->setCenter(centre);
    zaf::ui::addSubview(this, indicator);

    // The progress display sits under the indicator, centred on the same vertical line.
    if (!m_progressBar) {
        auto *bar = new QProgressBar(this);
        bar->setObjectName(QStringLiteral("progressOverlayBar"));
        bar->setTextVisible(false);
        bar->setFixedSize(kProgressBarWidth, kProgressBarHeight);
        m_progressBar = bar;
        auto *label = new QLabel(this);
        label->setObjectName(QStringLiteral("progressOverlayLabel"));
        label->setAlignment(Qt::AlignCenter);
        QPalette palette = label->palette();
        palette.setColor(QPalette::WindowText, Qt::white);
        label->setPalette(palette);
        m_progressLabel = label;
    }
    const int indicatorBottom = indicator->geometry().bottom() + 1;
    const int barTop = indicatorBottom + kProgressSpacing;
    m_progressBar->move(int(std::lround(centre.x() - kProgressBarWidth / 2.0)), barTop);
    m_progressLabel->setGeometry(int(std::lround(centre.x() - kProgressBarWidth / 2.0)),
                                 barTop + kProgressBarHeight + kProgressSpacing / 2, kProgressBarWidth,
                                 kLabelHeight);
    if (!m_progressPanel) {
        m_progressPanel = new ProgressPanel(this);
        m_progressPanel->setObjectName(QStringLiteral("progressOverlayPanel"));
    }
    const int panelWidth = std::max(indicator->width(), kProgressBarWidth) + 2 * kProgressPanelPadding;
    const int panelTop = indicator->geometry().top() - kProgressPanelPadding;
    int panelBottom = m_progressLabel->geometry().bottom() + 1 + kProgressPanelPadding / 2;
    if (m_cancelButton)
        panelBottom = std::max(panelBottom, m_cancelButton->geometry().bottom() + 1 + kProgressPanelPadding / 2);
    m_progressPanel->setGeometry(int(std::lround(centre.x() - panelWidth / 2.0)), panelTop, panelWidth,
                                 panelBottom - panelTop);
    zaf::ui::addSubview(this, m_progressPanel);
    zaf::ui::addSubview(this, m_progressBar);
    zaf::ui::addSubview(this, m_progressLabel);
    m_progressPanel->stackUnder(indicator);
    if (m_cancelButton)
        m_cancelButton->raise();
    applyProgress();

    // The fade-in was cut short by hiding: the indicator exists, but hiding asked for it to be gone.
    if (!m_isShowing)
        zaf::ui::removeFromSuperview(indicator);
}

void ZafYouTubeActivityProgressOverlay::setProgress(double fraction)
{
    if (std::isnan(fraction) || fraction < 0.0)
        m_progress = -1.0;
    else
        m_progress = std::min(fraction, 1.0);
    applyProgress();
}

QString ZafYouTubeActivityProgressOverlay::progressText(double fraction)
{
    if (std::isnan(fraction) || fraction < 0.0)
        return QString();
    const int percent = int(std::floor(std::min(fraction, 1.0) * 100.0 + 1e-9));
    return zaf::text::formatPercent(percent);
}

void ZafYouTubeActivityProgressOverlay::applyProgress()
{
    if (!m_progressBar || !m_progressLabel)
        return;
    if (m_progress < 0.0) {
        // Unknown total: the bar shows its busy state.
        m_progressBar->setRange(0, 0);
        m_progressBar->setValue(0);
    } else {
        m_progressBar->setRange(0, kProgressSteps);
        m_progressBar->setValue(int(std::lround(m_progress * kProgressSteps)));
    }
    m_progressLabel->setText(progressText(m_progress));
}
