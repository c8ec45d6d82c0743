// Toolbar and BarButtonItem on real widgets.
#include "platform/ui/bar_button_item.h"
#include "platform/ui/toolbar.h"

#include <QAction>
#include <QApplication>
#include <QLabel>
#include <QMouseEvent>
#include <QPointer>
#include <QSignalMapper>
#include <gtest/gtest.h>

#include <memory>

namespace zaf::ui {
namespace {

void settle()
{
    for (int i = 0; i < 3; ++i) {
        QCoreApplication::sendPostedEvents(nullptr, QEvent::DeferredDelete);
        QApplication::processEvents();
    }
}

// Pixels of a grabbed widget that are clearly of `colour`.
int pixelsNear(QWidget *widget, const QColor &colour)
{
    const QImage image = widget->grab().toImage().convertToFormat(QImage::Format_ARGB32);
    int count = 0;
    for (int y = 0; y < image.height(); ++y) {
        for (int x = 0; x < image.width(); ++x) {
            const QColor c = QColor::fromRgba(image.pixel(x, y));
            count += c.alpha() > 120 && std::abs(c.red() - colour.red()) < 60
                && std::abs(c.green() - colour.green()) < 60 && std::abs(c.blue() - colour.blue()) < 60;
        }
    }
    return count;
}

// The mean row of a grabbed widget's drawn pixels (those that differ from its background, which a
// grab fills in from the palette).
double inkCentreY(QWidget *widget)
{
    const QImage image = widget->grab().toImage().convertToFormat(QImage::Format_ARGB32);
    const QRgb background = image.pixel(0, 0);
    double sum = 0, weight = 0;
    for (int y = 0; y < image.height(); ++y) {
        for (int x = 0; x < image.width(); ++x) {
            if (std::abs(qGray(image.pixel(x, y)) - qGray(background)) > 60)
                sum += y, weight += 1;
        }
    }
    return weight > 0 ? sum / weight : -1;
}

// Two toolbars in a shown window, and items; Play's "map" action reaches the QSignalMapper, which
// reports the sender.
struct ToolbarTest : ::testing::Test {
    QWidget window;
    Toolbar *top = new Toolbar(&window);
    Toolbar *bottom = new Toolbar(&window);
    QSignalMapper mapper;
    int plays = 0;
    QObject *lastSender = nullptr;
    std::function<void()> onPlay;
    BarButtonItem play{SystemItem::Play, &mapper, "map"};
    BarButtonItem done{SystemItem::Done, nullptr, "doneAction"};
    BarButtonItem cancel{SystemItem::Cancel, nullptr, "doneAction"};
    BarButtonItem save{SystemItem::Save, nullptr, "saveAction"};
    BarButtonItem share{SystemItem::Action, nullptr, "shareAction"};
    BarButtonItem flex{SystemItem::FlexibleSpace, nullptr, {}};
    BarButtonItem fixed{SystemItem::FixedSpace, nullptr, {}};

    void SetUp() override
    {
        mapper.setMapping(&play, &play);
        QObject::connect(&mapper, &QSignalMapper::mappedObject, [this](QObject *sender) {
            ++plays, lastSender = sender;
            if (onPlay)
                onPlay();
        });
        window.resize(600, 400);
        top->setGeometry(0, 0, 600, 60);
        bottom->setGeometry(0, 356, 600, 44);
        window.show();
        settle();
    }
};

TEST_F(ToolbarTest, SetItemsReplacesWholeListKeepingOrderAndRepeatedSpaces)
{
    fixed.setWidth(0.005 * 1280);
    top->setItems({&cancel, &flex, &play, &flex, &save});
    settle();
    top->setItems({&done, &flex, &play, &flex, &fixed, &save, &fixed});
    settle();

    ASSERT_EQ(top->items(), (QList<BarButtonItem *>{&done, &flex, &play, &flex, &fixed, &save, &fixed}));
    // One widget per occurrence, left to right in list order, the two flexible spaces distinct.
    int previousRight = -1;
    for (int i = 0; i < 7; ++i) {
        QWidget *widget = top->widgetForItemAt(i);
        ASSERT_NE(widget, nullptr) << i;
        EXPECT_TRUE(widget->isVisible()) << i;
        const QRect frame(widget->mapTo(top, QPoint(0, 0)), widget->size());
        EXPECT_GE(frame.left(), previousRight) << i;
        previousRight = frame.right();
    }
    EXPECT_NE(top->widgetForItemAt(1), top->widgetForItemAt(3));
    EXPECT_EQ(top->widgetForItemAt(7), nullptr);
    // Fixed spaces take their width, rounded, and follow later changes.
    EXPECT_EQ(top->widgetForItemAt(4)->width(), 6);
    fixed.setWidth(24);
    settle();
    EXPECT_EQ(top->widgetForItemAt(4)->width(), 24);
    EXPECT_EQ(top->widgetForItemAt(6)->width(), 24);
    // The flexible spaces take the slack between them equally.
    EXPECT_GT(top->widgetForItemAt(1)->width(), 100);
    EXPECT_NEAR(top->widgetForItemAt(1)->width(), top->widgetForItemAt(3)->width(), 2);
    // The same space item in another toolbar gets spacers of its own.
    bottom->setItems({&share, &flex, &play, &flex});
    settle();
    EXPECT_NE(bottom->widgetForItemAt(1), top->widgetForItemAt(1));
    EXPECT_TRUE(top->widgetForItemAt(1)->isVisible());
    bottom->setItems({});
    settle();
    EXPECT_TRUE(bottom->items().isEmpty());
    EXPECT_EQ(bottom->widgetForItemAt(0), nullptr);
}

TEST_F(ToolbarTest, TintColoursTextItemsOnlyOnTheToolbarGivenIt)
{
    const QColor red(220, 0, 0);
    top->setTintColor(red);
    top->setItems({&cancel, &flex, &save});
    bottom->setItems({&cancel, &flex, &save});
    settle();
    EXPECT_EQ(top->tintColor(), red);
    EXPECT_FALSE(bottom->tintColor().isValid());
    EXPECT_GT(pixelsNear(top->widgetForItemAt(0), red), 5);
    EXPECT_EQ(pixelsNear(bottom->widgetForItemAt(0), red), 0);
    // A tint given after the items are shown applies too.
    bottom->setTintColor(QColor(0, 0, 220));
    settle();
    EXPECT_GT(pixelsNear(bottom->widgetForItemAt(2), QColor(0, 0, 220)), 5);
}

TEST_F(ToolbarTest, ImageInsetsMoveTheIconWithoutMovingTheButton)
{
    top->setItems({&flex, &play, &flex});
    settle();
    QWidget *button = top->widgetForItemAt(1);
    const QRect before = button->geometry();
    const double plain = inkCentreY(button);
    ASSERT_GE(plain, 0);
    // The button is vertically centred in the bar whose height the caller chose.
    EXPECT_NEAR(button->mapTo(top, button->rect().center()).y(), top->height() / 2, 2);

    play.setImageInsets({8, 0, -8, 0});
    settle();
    EXPECT_EQ(play.imageInsets(), (EdgeInsets{8, 0, -8, 0}));
    EXPECT_EQ(top->widgetForItemAt(1)->geometry(), before);
    EXPECT_NEAR(inkCentreY(top->widgetForItemAt(1)) - plain, 8.0, 1.0);

    play.setImageInsets({});
    settle();
    EXPECT_NEAR(inkCentreY(top->widgetForItemAt(1)), plain, 0.5);
}

// Text items show their standard text, the others an icon; every button is named for screen readers
// and tool tips by its title.
TEST(BarButtonItemTest, SystemKindsHaveStandardTextsIconsAndAccessibleNames)
{
    const struct {
        SystemItem kind;
        const char *title;   // nullptr: an icon item, any title
    } cases[] = {
        {SystemItem::Done, "Done"}, {SystemItem::Cancel, "Cancel"}, {SystemItem::Save, "Save"}, {SystemItem::Action, nullptr},
        {SystemItem::Play, nullptr}, {SystemItem::Pause, nullptr}, {SystemItem::Undo, nullptr},
    };
    Toolbar bar;
    bar.resize(300, 44);
    for (const auto &c : cases) {
        BarButtonItem item(c.kind, nullptr, {});
        SCOPED_TRACE(item.title().toStdString());
        EXPECT_FALSE(item.title().isEmpty());
        if (c.title) {
            EXPECT_EQ(item.title(), QString::fromLatin1(c.title));   // no translation installed
        }
        EXPECT_EQ(item.icon().isNull(), c.title != nullptr);
        EXPECT_FALSE(item.isSpace());
        ASSERT_NE(item.action(), nullptr);
        bar.setItems({&item});
        EXPECT_EQ(bar.widgetForItemAt(0)->accessibleName(), item.title());
        EXPECT_EQ(bar.widgetForItemAt(0)->toolTip(), item.title());
        bar.setItems({});
        settle();
    }
    BarButtonItem space(SystemItem::FlexibleSpace, nullptr, {});
    EXPECT_TRUE(space.isSpace());
    EXPECT_EQ(space.action(), nullptr);
}

// A member-function item calls its receiver, and stops calling it once the receiver is gone.
TEST(BarButtonItemTest, MemberFunctionActionReachesItsReceiverWhileItLives)
{
    struct Receiver : QObject {
        int calls = 0;
        void act() { ++calls; }
    };
    auto receiver = std::make_unique<Receiver>();
    BarButtonItem item(SystemItem::Save, receiver.get(), &Receiver::act);
    item.trigger();
    item.action()->trigger();
    EXPECT_EQ(receiver->calls, 2);
    receiver.reset();
    item.trigger();
}

TEST_F(ToolbarTest, ClickingAButtonSendsTheActionEvenWhenItReplacesTheItems)
{
    onPlay = [&] { top->setItems({&flex, &save}); };
    top->setItems({&flex, &play, &flex});
    settle();
    QWidget *button = top->widgetForItemAt(1);
    const QPointF centre = button->rect().center();
    QMouseEvent press(QEvent::MouseButtonPress, centre, button->mapToGlobal(centre), Qt::LeftButton, Qt::LeftButton, Qt::NoModifier);
    QMouseEvent release(QEvent::MouseButtonRelease, centre, button->mapToGlobal(centre), Qt::LeftButton, Qt::NoButton, Qt::NoModifier);
    QApplication::sendEvent(button, &press);
    QApplication::sendEvent(button, &release);
    EXPECT_EQ(plays, 1);
    EXPECT_EQ(lastSender, &play);
    settle();
    EXPECT_EQ(top->items(), (QList<BarButtonItem *>{&flex, &save}));

    play.setEnabled(false);
    play.trigger();
    EXPECT_EQ(plays, 1);
}

TEST_F(ToolbarTest, CustomViewLivesInTheToolbarThatShowedItLastAndSurvivesRemoval)
{
    auto *label = new QLabel("Title");
    label->resize(120, 17);
    QPointer<QLabel> guard(label);
    {
        BarButtonItem title(label);
        EXPECT_FALSE(title.isSystemItem());
        top->setItems({&flex, &title, &flex});
        settle();
        EXPECT_TRUE(top->isAncestorOf(label));
        EXPECT_EQ(label->size(), QSize(120, 17));
        // Centred in its occurrence.
        const QPoint centre = label->mapTo(top, label->rect().center());
        EXPECT_NEAR(centre.y(), top->height() / 2, 2);

        bottom->setItems({&title});
        settle();
        EXPECT_TRUE(bottom->isAncestorOf(label));
        EXPECT_FALSE(top->isAncestorOf(label));

        bottom->setItems({});
        settle();
        ASSERT_FALSE(guard.isNull());   // the toolbar gave it back instead of deleting it
    }
    EXPECT_TRUE(guard.isNull());   // the item deletes a custom view nobody shows
}

} // namespace
} // namespace zaf::ui
