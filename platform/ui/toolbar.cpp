#include "platform/ui/toolbar.h"

#include "platform/ui/bar_button_item.h"
#include "platform/thread_rules.h"

#include <QIcon>
#include <QPainter>
#include <QPointer>
#include <QStyleOption>
#include <QToolBar>
#include <QToolButton>
#include <QVBoxLayout>

#include <cmath>

namespace zaf::ui {

namespace {

constexpr int kIconSize = 24;
constexpr int kHorizontalPadding = 10;
constexpr int kVerticalPadding = 6;
// The bar: a light, slightly see-through white, with a faint hairline toward the content.
const QColor kBarColor(248, 248, 248, 230);
const QColor kHairlineColor(0, 0, 0, 38);

// Whether every visible pixel of an image has one colour (antialiasing only changes alpha): the
// freedesktop "-symbolic" icons are drawn like that and take a tint; full-colour icons keep theirs.
bool isMonochrome(const QImage &image)
{
    const QImage argb = image.convertToFormat(QImage::Format_ARGB32);
    bool seen = false;
    QRgb reference = 0;
    for (int y = 0; y < argb.height(); ++y) {
        const auto *line = reinterpret_cast<const QRgb *>(argb.constScanLine(y));
        for (int x = 0; x < argb.width(); ++x) {
            if (qAlpha(line[x]) < 96)
                continue;
            if (!seen) {
                reference = line[x];
                seen = true;
            } else if (std::abs(qRed(line[x]) - qRed(reference)) > 40
                       || std::abs(qGreen(line[x]) - qGreen(reference)) > 40
                       || std::abs(qBlue(line[x]) - qBlue(reference)) > 40) {
                return false;
            }
        }
    }
    return seen;
}

QPixmap tinted(const QPixmap &pixmap, const QColor &tint)
{
    QPixmap result(pixmap.size());
    result.setDevicePixelRatio(pixmap.devicePixelRatio());
    result.fill(Qt::transparent);
    QPainter painter(&result);
    painter.drawPixmap(0, 0, pixmap);
    painter.setCompositionMode(QPainter::CompositionMode_SourceIn);
    painter.fillRect(QRectF(QPointF(0, 0), pixmap.deviceIndependentSize()), tint);
    return result;
}

// The button of a system item that is not a space: draws the item's icon (moved by its image
// insets, tinted when monochrome) or its title in the toolbar's tint colour.
class ItemButton : public QToolButton {
public:
    ItemButton(BarButtonItem *item, const QColor &tint) : m_item(item), m_tint(tint)
    {
        setAutoRaise(true);
        setFocusPolicy(Qt::TabFocus);
        setSizePolicy(QSizePolicy::Preferred, QSizePolicy::Preferred);
        syncWithItem();
        connect(this, &QToolButton::clicked, this, [this] {
            if (m_item)
                m_item->trigger();
        });
    }

    void setTint(const QColor &tint)
    {
        m_tint = tint;
        update();
    }

    void syncWithItem()
    {
        if (!m_item)
            return;
        setEnabled(m_item->isEnabled());
        setToolTip(m_item->toolTip());
        setAccessibleName(m_item->title());
        setText(m_item->title());
        updateGeometry();
        update();
    }

    QSize sizeHint() const override
    {
        if (!m_item)
            return QSize(kIconSize, kIconSize);
        if (!m_item->icon().isNull())
            return QSize(kIconSize + 2 * kHorizontalPadding, kIconSize + 2 * kVerticalPadding);
        const QFontMetrics metrics(font());
        return QSize(metrics.horizontalAdvance(m_item->title()) + 2 * kHorizontalPadding,
                     metrics.height() + 2 * kVerticalPadding);
    }
    QSize minimumSizeHint() const override { return sizeHint(); }

    // The rectangle the icon is centred in: the button's rectangle shrunk by the image insets, so
    // equal and opposite top and bottom insets move the icon without resizing it.
    QRect iconArea() const
    {
        const EdgeInsets insets = m_item ? m_item->imageInsets() : EdgeInsets();
        return rect().adjusted(int(std::lround(insets.left)), int(std::lround(insets.top)),
                               -int(std::lround(insets.right)), -int(std::lround(insets.bottom)));
    }

protected:
    void paintEvent(QPaintEvent *) override
    {
        QPainter painter(this);
        if (isEnabled() && (isDown() || underMouse())) {
            QStyleOptionToolButton option;
            initStyleOption(&option);
            style()->drawPrimitive(QStyle::PE_PanelButtonTool, &option, &painter, this);
        }
        if (!m_item)
            return;
        if (!m_item->icon().isNull()) {
            QPixmap pixmap = m_item->icon().pixmap(QSize(kIconSize, kIconSize), devicePixelRatioF(),
                                                   isEnabled() ? QIcon::Normal : QIcon::Disabled);
            if (m_tint.isValid() && isMonochrome(pixmap.toImage())) {
                QColor tint = m_tint;
                if (!isEnabled())
                    tint.setAlphaF(tint.alphaF() * 0.35f);
                pixmap = tinted(pixmap, tint);
            } else if (!isEnabled()) {
                // The style's disabled pixmap of a dark glyph on a light bar reads as enabled.
                painter.setOpacity(0.35);
            }
            const QSizeF size = pixmap.deviceIndependentSize();
            const QPointF centre = QRectF(iconArea()).center();
            painter.drawPixmap(QPointF(centre.x() - size.width() / 2, centre.y() - size.height() / 2), pixmap);
            return;
        }
        QColor colour = m_tint.isValid() ? m_tint : palette().color(QPalette::ButtonText);
        if (!isEnabled())
            colour.setAlphaF(colour.alphaF() * 0.35f);
        painter.setPen(colour);
        painter.drawText(rect(), Qt::AlignCenter, m_item->title());
    }

private:
    QPointer<BarButtonItem> m_item;
    QColor m_tint;
};

// Shows a custom item's widget at its own size, centred.
class CustomHost : public QWidget {
public:
    explicit CustomHost(QWidget *view) : m_view(view)
    {
        view->setParent(this);
        view->show();
        setSizePolicy(QSizePolicy::Fixed, QSizePolicy::Preferred);
    }
    QWidget *view() const { return m_view; }
    QSize sizeHint() const override { return m_view ? m_view->size() : QSize(); }
    QSize minimumSizeHint() const override { return sizeHint(); }

    // Gives the view back when this host goes away, so the view outlives the occurrence.
    void release()
    {
        if (m_view && m_view->parentWidget() == this) {
            m_view->hide();
            m_view->setParent(nullptr);
        }
    }

protected:
    void resizeEvent(QResizeEvent *) override
    {
        if (m_view && m_view->parentWidget() == this)
            m_view->move((width() - m_view->width()) / 2, (height() - m_view->height()) / 2);
    }

private:
    QPointer<QWidget> m_view;
};

// The row of item widgets. The Toolbar paints the bar, so the row paints nothing of its own.
class Row : public QToolBar {
public:
    Row()
    {
        setMovable(false);
        setFloatable(false);
        setIconSize(QSize(kIconSize, kIconSize));
        setContextMenuPolicy(Qt::PreventContextMenu);
    }

protected:
    void paintEvent(QPaintEvent *) override {}
};

} // namespace

struct Toolbar::Private {
    QList<QPointer<BarButtonItem>> items;
    QList<QPointer<QWidget>> widgets;   // one per occurrence, in the order of items
    QColor tint;
    QPointer<QObject> delegate;
    QPointer<Row> row;
    QVBoxLayout *layout = nullptr;
};

Toolbar::Toolbar(QWidget *parent) : QWidget(parent), d(std::make_unique<Private>())
{
    ZAF_ASSERT_MAIN_THREAD();
    d->layout = new QVBoxLayout(this);
    d->layout->setContentsMargins(0, 0, 0, 0);
    d->layout->setSpacing(0);
    d->row = new Row;
    d->layout->addWidget(d->row);
}

Toolbar::~Toolbar()
{
    // Custom views belong to their items, not to the bar that happened to show them last.
    for (const QPointer<QWidget> &widget : std::as_const(d->widgets)) {
        if (auto *host = dynamic_cast<CustomHost *>(widget.data()))
            host->release();
    }
}

void Toolbar::setItems(const QList<BarButtonItem *> &items, bool animated)
{
    ZAF_ASSERT_MAIN_THREAD();
    // The change is immediate either way; `animated` exists for callers that ask for a transition.
    Q_UNUSED(animated);

    for (const QPointer<QWidget> &widget : std::as_const(d->widgets)) {
        if (auto *host = dynamic_cast<CustomHost *>(widget.data()))
            host->release();
    }
    for (const QPointer<BarButtonItem> &item : std::as_const(d->items)) {
        if (item)
            disconnect(item, nullptr, this, nullptr);
    }
    // The old row may hold the button whose click led here: it goes away on a later pass.
    if (d->row) {
        d->layout->removeWidget(d->row);
        d->row->hide();
        d->row->deleteLater();
    }
    d->items.clear();
    d->widgets.clear();

    d->row = new Row;
    for (BarButtonItem *item : items) {
        QWidget *widget = nullptr;
        if (!item) {
            widget = new QWidget;
        } else if (item->isSystemItem() && item->systemItem() == SystemItem::FlexibleSpace) {
            widget = new QWidget;
            widget->setSizePolicy(QSizePolicy::Expanding, QSizePolicy::Preferred);
            widget->setMinimumWidth(0);
        } else if (item->isSystemItem() && item->systemItem() == SystemItem::FixedSpace) {
            widget = new QWidget;
            widget->setFixedWidth(int(std::lround(item->width())));
        } else if (!item->isSystemItem()) {
            widget = item->customView() ? static_cast<QWidget *>(new CustomHost(item->customView())) : new QWidget;
        } else {
            widget = new ItemButton(item, d->tint);
            item->setView(widget);
        }
        d->row->addWidget(widget);
        d->items.append(item);
        d->widgets.append(widget);
        if (item && !d->items.mid(0, d->items.size() - 1).contains(item))
            connect(item, &BarButtonItem::changed, this, [this, item] { itemChanged(item); });
    }
    d->layout->addWidget(d->row);
    d->row->show();
}

void Toolbar::itemChanged(BarButtonItem *item)
{
    for (qsizetype i = 0; i < d->items.size(); ++i) {
        if (d->items[i] != item || !d->widgets[i])
            continue;
        if (item->isSystemItem() && item->systemItem() == SystemItem::FixedSpace)
            d->widgets[i]->setFixedWidth(int(std::lround(item->width())));
        else if (auto *button = dynamic_cast<ItemButton *>(d->widgets[i].data()))
            button->syncWithItem();
    }
}

QList<BarButtonItem *> Toolbar::items() const
{
    QList<BarButtonItem *> items;
    for (const QPointer<BarButtonItem> &item : d->items) {
        if (item)
            items.append(item);
    }
    return items;
}

void Toolbar::setTintColor(const QColor &color)
{
    d->tint = color;
    for (const QPointer<QWidget> &widget : std::as_const(d->widgets)) {
        if (auto *button = dynamic_cast<ItemButton *>(widget.data()))
            button->setTint(color);
    }
}

QColor Toolbar::tintColor() const
{
    return d->tint;
}

void Toolbar::setDelegate(QObject *delegate)
{
    d->delegate = delegate;
}

QObject *Toolbar::delegate() const
{
    return d->delegate;
}

QWidget *Toolbar::widgetForItemAt(int index) const
{
    if (index < 0 || index >= d->widgets.size())
        return nullptr;
    return d->widgets[index];
}

void Toolbar::paintEvent(QPaintEvent *)
{
    QPainter painter(this);
    painter.fillRect(rect(), kBarColor);
    // The hairline faces the content: at the bottom of a bar in the upper half of its parent.
    const bool upper = !parentWidget() || geometry().center().y() <= parentWidget()->height() / 2;
    painter.fillRect(upper ? QRect(0, height() - 1, width(), 1) : QRect(0, 0, width(), 1), kHairlineColor);
}

} // namespace zaf::ui
