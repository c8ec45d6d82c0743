#include "host/demo/demo_scene.h"

#include <QFont>
#include <QLinearGradient>
#include <QPainter>
#include <QPainterPath>
#include <QRadialGradient>
#include <QtMath>

#include <array>
#include <cmath>

namespace zaf::demo {

namespace {

// The scene is laid out on a 960 x 540 stage and scaled to the target size.
constexpr double kStageWidth = 960;
constexpr double kStageHeight = 540;
constexpr double kFloorY = 440;
constexpr double kBallRadius = 26;

constexpr std::array<int, kMelodyLength> kMelody = {0, 3, 5, 7, 10, 12, 10, 7, 5, 7, 12, 15, 12, 10, 7, 3};

QString clockText(double seconds)
{
    const int hundredths = int(std::floor(seconds * 100));
    return QStringLiteral("%1:%2.%3")
        .arg(hundredths / 6000, 2, 10, QLatin1Char('0'))
        .arg(hundredths / 100 % 60, 2, 10, QLatin1Char('0'))
        .arg(hundredths % 100, 2, 10, QLatin1Char('0'));
}

void paintBackground(QPainter &p, double t)
{
    const double hue = std::fmod(200 + t * 24, 360);
    QLinearGradient sky(0, 0, kStageWidth, kStageHeight);
    sky.setColorAt(0, QColor::fromHslF(float(hue / 360), 0.65f, 0.28f));
    sky.setColorAt(0.55, QColor::fromHslF(float(std::fmod(hue + 50, 360) / 360), 0.60f, 0.20f));
    sky.setColorAt(1, QColor::fromHslF(float(std::fmod(hue + 110, 360) / 360), 0.55f, 0.12f));
    p.fillRect(QRectF(0, 0, kStageWidth, kStageHeight), sky);

    // Floor: lines running towards the viewer, so the stage never stands still.
    p.fillRect(QRectF(0, kFloorY, kStageWidth, kStageHeight - kFloorY), QColor(0, 0, 0, 70));
    p.setPen(QPen(QColor(255, 255, 255, 40), 1));
    const double scroll = std::fmod(t * 0.8, 1.0);
    for (int i = 0; i < 8; ++i) {
        const double d = (i + scroll) / 8.0;
        const double y = kFloorY + (kStageHeight - kFloorY) * d * d;
        p.drawLine(QPointF(0, y), QPointF(kStageWidth, y));
    }
    for (int i = -8; i <= 8; ++i) {
        const double xTop = kStageWidth / 2 + i * 40;
        const double xBottom = kStageWidth / 2 + i * 140;
        p.drawLine(QPointF(xTop, kFloorY), QPointF(xBottom, kStageHeight));
    }
}

void paintWave(QPainter &p, double t)
{
    QPainterPath wave;
    for (int x = 0; x <= int(kStageWidth); x += 8) {
        const double y = 300 + 38 * std::sin(x / 70.0 - t * 3.1) + 14 * std::sin(x / 23.0 + t * 1.7);
        if (x == 0)
            wave.moveTo(x, y);
        else
            wave.lineTo(x, y);
    }
    p.setPen(QPen(QColor(255, 255, 255, 90), 5, Qt::SolidLine, Qt::RoundCap));
    p.setBrush(Qt::NoBrush);
    p.drawPath(wave);
}

void paintTiles(QPainter &p, double t)
{
    const QPointF centre(430, 230);
    for (int i = 0; i < 6; ++i) {
        const double angle = t * 0.9 + i * M_PI / 3;
        const QPointF at = centre + QPointF(std::cos(angle) * 190, std::sin(angle) * 90);
        p.save();
        p.translate(at);
        p.rotate(qRadiansToDegrees(t * 1.6 + i));
        const double size = 34 + 10 * std::sin(t * 2.3 + i);
        QColor c = QColor::fromHsvF(float(std::fmod(i / 6.0 + t * 0.05, 1.0)), 0.7f, 1.0f, 0.85f);
        p.setPen(QPen(c.lighter(140), 2));
        p.setBrush(c);
        p.drawRoundedRect(QRectF(-size / 2, -size / 2, size, size), 8, 8);
        p.restore();
    }
}

void paintBall(QPainter &p, double t)
{
    const QPointF pos = ballPosition(t);
    const QPointF centre(kBallRadius + pos.x() * (kStageWidth - 2 * kBallRadius),
                         kFloorY - kBallRadius - (1 - pos.y()) * 260);
    const double height = 1 - pos.y();

    // Shadow on the floor, smaller and fainter the higher the ball.
    p.setPen(Qt::NoPen);
    p.setBrush(QColor(0, 0, 0, int(110 * (1 - 0.6 * height))));
    const double shadowWidth = kBallRadius * (2.2 - height);
    p.drawEllipse(QPointF(centre.x(), kFloorY + 6), shadowWidth, 7);

    // Squash a little on landing.
    const double squash = height < 0.08 ? 1 - (0.08 - height) * 2.5 : 1;
    const qint64 beat = qint64(std::floor(t / kBeatSeconds));
    const QColor colour = noteColour(beat);
    QRadialGradient shine(centre + QPointF(-9, -10), kBallRadius * 1.4);
    shine.setColorAt(0, colour.lighter(180));
    shine.setColorAt(0.5, colour);
    shine.setColorAt(1, colour.darker(200));
    p.setBrush(shine);
    p.drawEllipse(QPointF(centre.x(), centre.y() + kBallRadius * (1 - squash)), kBallRadius / squash,
                  kBallRadius * squash);

    // A ring spreads from every landing.
    const double sinceLanding = t - beat * kBeatSeconds;
    if (sinceLanding < 0.35) {
        const double k = sinceLanding / 0.35;
        QColor ring = colour.lighter(150);
        ring.setAlphaF(float(0.8 * (1 - k)));
        p.setPen(QPen(ring, 3));
        p.setBrush(Qt::NoBrush);
        p.drawEllipse(QPointF(centre.x(), kFloorY + 6), 30 + 90 * k, 6 + 16 * k);
    }
}

void paintClock(QPainter &p, double t)
{
    const QPointF centre(850, 118);
    const double radius = 70;
    p.setPen(QPen(QColor(255, 255, 255, 220), 3));
    p.setBrush(QColor(0, 0, 0, 90));
    p.drawEllipse(centre, radius, radius);
    for (int i = 0; i < 12; ++i) {
        const double a = i * M_PI / 6;
        const double inner = i % 3 == 0 ? radius - 14 : radius - 8;
        p.drawLine(centre + QPointF(std::sin(a) * inner, -std::cos(a) * inner),
                   centre + QPointF(std::sin(a) * (radius - 3), -std::cos(a) * (radius - 3)));
    }
    // The second hand ticks once a second with a short spring; one turn is a minute.
    const double whole = std::floor(t);
    const double f = t - whole;
    const double settle = f < 0.12 ? std::sin(f / 0.12 * M_PI / 2) * 1.08 : 1 + 0.08 * std::exp(-(f - 0.12) * 18);
    const double secondAngle = std::max(0.0, whole - 1 + std::min(settle, 1.08)) * 2 * M_PI / 60;
    const double sweepAngle = t * 2 * M_PI / 10; // a slower hand: one turn every ten seconds
    p.setPen(QPen(QColor(120, 220, 255), 6, Qt::SolidLine, Qt::RoundCap));
    p.drawLine(centre, centre + QPointF(std::sin(sweepAngle) * 38, -std::cos(sweepAngle) * 38));
    p.setPen(QPen(QColor(255, 90, 80), 2.5, Qt::SolidLine, Qt::RoundCap));
    p.drawLine(centre - QPointF(std::sin(secondAngle) * 12, -std::cos(secondAngle) * 12),
               centre + QPointF(std::sin(secondAngle) * (radius - 10), -std::cos(secondAngle) * (radius - 10)));
    p.setBrush(QColor(255, 90, 80));
    p.setPen(Qt::NoPen);
    p.drawEllipse(centre, 5, 5);
}

void paintTexts(QPainter &p, const SceneState &state)
{
    const double t = state.seconds;
    // The big second counter: every second of the recording looks different, so a trim shows.
    QFont big(QStringLiteral("DejaVu Sans"));
    big.setPixelSize(150);
    big.setBold(true);
    p.setFont(big);
    p.setPen(QColor(255, 255, 255, 60));
    p.drawText(QRectF(0, 110, kStageWidth, 200), Qt::AlignCenter, QString::number(int(std::floor(t))));

    QFont clock(QStringLiteral("DejaVu Sans Mono"));
    clock.setPixelSize(40);
    clock.setBold(true);
    p.setFont(clock);
    p.setPen(Qt::white);
    p.drawText(QRectF(700, 200, 240, 50), Qt::AlignCenter, clockText(t));

    QFont small(QStringLiteral("DejaVu Sans Mono"));
    small.setPixelSize(15);
    p.setFont(small);
    p.setPen(QColor(255, 255, 255, 200));
    p.drawText(QRectF(0, kStageHeight - 34, kStageWidth - 16, 20), Qt::AlignRight | Qt::AlignVCenter,
               QStringLiteral("frame %1").arg(state.frameNumber, 4, 10, QLatin1Char('0')));

    QFont title(QStringLiteral("DejaVu Sans"));
    title.setPixelSize(18);
    p.setFont(title);
    p.drawText(QRectF(16, kStageHeight - 34, 500, 20), Qt::AlignLeft | Qt::AlignVCenter,
               QStringLiteral("Zafrel Demo Recorder"));
}

void paintProgress(QPainter &p, const SceneState &state)
{
    if (!(state.totalSeconds > 0))
        return;
    const QRectF bar(16, kStageHeight - 10, kStageWidth - 32, 5);
    p.setPen(Qt::NoPen);
    p.setBrush(QColor(255, 255, 255, 60));
    p.drawRoundedRect(bar, 2.5, 2.5);
    const double k = std::clamp(state.seconds / state.totalSeconds, 0.0, 1.0);
    p.setBrush(QColor(255, 255, 255, 220));
    p.drawRoundedRect(QRectF(bar.topLeft(), QSizeF(bar.width() * k, bar.height())), 2.5, 2.5);
    p.setBrush(QColor(255, 255, 255, 120));
    for (int s = 1; s < int(std::ceil(state.totalSeconds)); ++s) {
        const double x = bar.left() + bar.width() * s / state.totalSeconds;
        p.drawRect(QRectF(x - 0.5, bar.top() - 4, 1, 4));
    }
}

void paintRecordingBadge(QPainter &p, const SceneState &state)
{
    if (!state.recording)
        return;
    const QRectF badge(14, 14, 232, 42);
    p.setPen(Qt::NoPen);
    p.setBrush(QColor(0, 0, 0, 150));
    p.drawRoundedRect(badge, 21, 21);
    const double pulse = 0.55 + 0.45 * std::cos(state.seconds * 2 * M_PI);
    QColor red(235, 40, 40);
    red.setAlphaF(float(pulse));
    p.setBrush(red);
    p.drawEllipse(QPointF(badge.left() + 22, badge.center().y()), 9, 9);
    QFont f(QStringLiteral("DejaVu Sans"));
    f.setPixelSize(18);
    f.setBold(true);
    p.setFont(f);
    p.setPen(Qt::white);
    const int whole = int(std::floor(state.seconds));
    p.drawText(QRectF(badge.left() + 40, badge.top(), badge.width() - 48, badge.height()),
               Qt::AlignLeft | Qt::AlignVCenter,
               QStringLiteral("Recording  %1:%2").arg(whole / 60, 2, 10, QLatin1Char('0')).arg(whole % 60, 2, 10, QLatin1Char('0')));
}

} // namespace

int melodySemitone(qint64 beat)
{
    const qint64 i = ((beat % kMelodyLength) + kMelodyLength) % kMelodyLength;
    return kMelody[size_t(i)];
}

double melodyFrequency(qint64 beat)
{
    return 220.0 * std::pow(2.0, melodySemitone(beat) / 12.0);
}

QColor noteColour(qint64 beat)
{
    return QColor::fromHsv((melodySemitone(beat) * 23 + 10) % 360, 200, 255);
}

QPointF ballPosition(double seconds)
{
    // Across the stage and back every eight seconds; one hop per beat.
    const double u = std::fmod(std::max(0.0, seconds) / 4.0, 2.0);
    const double x = u < 1 ? u : 2 - u;
    const double phase = std::fmod(std::max(0.0, seconds), kBeatSeconds) / kBeatSeconds;
    const double height = 4 * phase * (1 - phase);
    return QPointF(x, 1 - height);
}

void paintScene(QPainter &painter, const QSize &size, const SceneState &state)
{
    painter.save();
    painter.setRenderHint(QPainter::Antialiasing, true);
    painter.setRenderHint(QPainter::TextAntialiasing, true);
    painter.scale(size.width() / kStageWidth, size.height() / kStageHeight);
    paintBackground(painter, state.seconds);
    paintWave(painter, state.seconds);
    paintTiles(painter, state.seconds);
    paintTexts(painter, state);
    paintClock(painter, state.seconds);
    paintBall(painter, state.seconds);
    paintProgress(painter, state);
    paintRecordingBadge(painter, state);
    painter.restore();
}

QImage renderScene(const QSize &size, const SceneState &state)
{
    QImage image(size, QImage::Format_RGB32);
    image.fill(Qt::black);
    QPainter painter(&image);
    paintScene(painter, size, state);
    painter.end();
    return image;
}

} // namespace zaf::demo
