// LayoutRules on the timeline container's two arrangements (above the bottom toolbar, or on the view's
// bottom edge), and how an autoresizing view follows its container.
#include "platform/ui/autoresizing.h"
#include "platform/ui/layout_rules.h"
#include "platform/ui/view_animation.h"

#include <QApplication>
#include <gtest/gtest.h>

namespace zaf::ui {
namespace {

using A = LayoutAttribute;

struct EditorLikeView : ::testing::Test {
    QWidget view;
    QWidget *bottomBar = new QWidget(&view);
    QWidget *container = new QWidget(&view);
    LayoutRules *rules = LayoutRules::forView(&view);

    void SetUp() override
    {
        view.resize(400, 700);
        bottomBar->setGeometry(0, 656, 400, 44);
        view.show();
    }

    // The four rules of the small-screen (bottom = toolbar top) or large-screen (bottom = view
    // bottom) arrangement.
    QList<LayoutRule> arrangement(bool large, const QByteArray &group = {})
    {
        return {
            {container, A::Leading, &view, A::Leading, 1, 0, group},
            {container, A::Trailing, &view, A::Trailing, 1, 0, group},
            large ? LayoutRule{container, A::Bottom, &view, A::Bottom, 1, 0, group}
                  : LayoutRule{container, A::Bottom, bottomBar, A::Top, 1, 0, group},
            {container, A::Height, nullptr, A::Leading, 1, 38, group},
        };
    }
};

TEST_F(EditorLikeView, SwitchingArrangementsBackAndForthNeverKeepsStaleGeometry)
{
    // Small screen: the container sits above the bottom toolbar.
    rules->addRules(arrangement(false));
    EXPECT_EQ(LayoutRules::forView(&view), rules);
    QApplication::processEvents();   // adding rules lays the view out on the next pass
    EXPECT_EQ(container->geometry(), QRect(0, 618, 400, 38));

    // Large screen: the bottom toolbar leaves the view, its rule goes dormant.
    removeFromSuperview(bottomBar);
    rules->addRules(arrangement(true));
    view.resize(700, 400);
    EXPECT_EQ(container->geometry(), QRect(0, 362, 700, 38));

    // Back to the small screen: the toolbar returns and the later rule on the bottom wins.
    view.resize(400, 700);
    bottomBar->setGeometry(0, 656, 400, 44);
    addSubview(&view, bottomBar);
    rules->addRules(arrangement(false));
    rules->layoutIfNeeded();
    EXPECT_EQ(container->geometry(), QRect(0, 618, 400, 38));
    // Re-adding equal rules replaced the old copies instead of piling them up.
    EXPECT_EQ(rules->rules().size(), 5);
}

TEST_F(EditorLikeView, RetiringAGroupLeavesOnlyTheOtherArrangement)
{
    rules->addRules(arrangement(true, "large"));
    rules->addRules(arrangement(false, "small"));
    rules->layoutIfNeeded();
    EXPECT_EQ(container->geometry(), QRect(0, 618, 400, 38));

    rules->removeRulesInGroup("small");
    EXPECT_EQ(rules->rules().size(), 4);
    rules->layoutIfNeeded();
    EXPECT_EQ(container->geometry(), QRect(0, 662, 400, 38));

    rules->removeRulesFor(container);
    EXPECT_TRUE(rules->rules().isEmpty());
    view.resize(300, 300);
    EXPECT_EQ(container->geometry(), QRect(0, 662, 400, 38));   // nothing moves it any more
}

TEST_F(EditorLikeView, RuleWhoseSecondItemBelongsElsewhereOrIsDestroyedIsSkippedNotTreatedAsConstant)
{
    QWidget elsewhere;
    QWidget *stranger = new QWidget(&elsewhere);
    stranger->setGeometry(0, 10, 50, 50);
    rules->addRules(arrangement(true));
    rules->addRule({container, A::Bottom, stranger, A::Top, 1, 0, {}});
    rules->layoutIfNeeded();
    EXPECT_EQ(container->geometry(), QRect(0, 662, 400, 38));

    rules->addRules(arrangement(false));
    delete bottomBar;
    bottomBar = nullptr;
    view.resize(400, 600);
    EXPECT_EQ(container->geometry(), QRect(0, 562, 400, 38));
}

TEST(LayoutRulesTest, AttributesCombinePerAxis)
{
    struct Case {
        const char *name;
        QList<std::tuple<A, A, double, double>> rules;   // attribute1, attribute2 of the view, m, c
        QRect expected;
    };
    const QList<Case> cases = {
        {"leading and width", {{A::Leading, A::Leading, 1, 10}, {A::Width, A::Width, 0.5, 0}}, QRect(10, 5, 100, 20)},
        {"trailing alone keeps width", {{A::Trailing, A::Trailing, 1, -10}}, QRect(140, 5, 50, 20)},
        {"centre and height", {{A::CenterY, A::CenterY, 1, 0}, {A::Height, A::Height, 0.25, 0}},
         QRect(0, 38, 50, 25)},
        {"centre x alone", {{A::CenterX, A::CenterX, 1, 0}}, QRect(75, 5, 50, 20)},
        {"top and bottom", {{A::Top, A::Top, 1, 4}, {A::Bottom, A::Bottom, 1, -4}}, QRect(0, 4, 50, 92)},
        {"later rule on same attribute wins", {{A::Leading, A::Leading, 1, 10}, {A::Leading, A::Trailing, 1, -60}},
         QRect(140, 5, 50, 20)},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.name);
        QWidget view;
        view.resize(200, 100);
        QWidget *item = new QWidget(&view);
        item->setGeometry(0, 5, 50, 20);
        LayoutRules *rules = LayoutRules::forView(&view);
        for (const auto &[a1, a2, m, k] : c.rules)
            rules->addRule({item, a1, &view, a2, m, k, {}});
        rules->layoutIfNeeded();
        EXPECT_EQ(item->geometry(), c.expected);
    }
}

TEST(LayoutRulesTest, ItemInsideANestedParentIsPlacedInViewCoordinates)
{
    QWidget view;
    view.resize(300, 300);
    QWidget *panel = new QWidget(&view);
    panel->setGeometry(50, 50, 200, 200);
    QWidget *item = new QWidget(panel);
    LayoutRules *rules = LayoutRules::forView(&view);
    rules->addRules({{item, A::Leading, &view, A::Leading, 1, 60, {}},
                     {item, A::Top, &view, A::Top, 1, 70, {}},
                     {item, A::Width, nullptr, A::Leading, 1, 10, {}},
                     {item, A::Height, nullptr, A::Leading, 1, 10, {}}});
    rules->layoutIfNeeded();
    EXPECT_EQ(item->geometry(), QRect(10, 20, 10, 10));
}

// A 40x20 view at (30, 40) in a 200x100 container, which then becomes 300x200.
struct AutoresizingCase {
    const char *name;
    AutoresizingMask mask;
    QRect after;
};

class AutoresizingTest : public ::testing::TestWithParam<AutoresizingCase> {};

TEST_P(AutoresizingTest, FlexiblePartsShareTheContainersChangeInProportion)
{
    QWidget container;
    container.resize(200, 100);
    auto *view = new QWidget;
    view->setGeometry(30, 40, 40, 20);
    setAutoresizingMask(view, GetParam().mask);
    view->setParent(&container); // follows the container it is put in afterwards
    container.show();
    container.resize(300, 200);
    EXPECT_EQ(view->geometry(), GetParam().after);
    EXPECT_EQ(autoresizingMask(view), GetParam().mask);
}

using R = Autoresizing;
INSTANTIATE_TEST_SUITE_P(Masks, AutoresizingTest, ::testing::Values(
    AutoresizingCase{"None", R::None, QRect(30, 40, 40, 20)},
    // Margins 30 and 130 share +100 as 30:130; 40 and 40 share +100 equally.
    AutoresizingCase{"FlexibleMargins", kFlexibleMargins, QRect(49, 90, 40, 20)},
    AutoresizingCase{"FlexibleWidthAlone", R::FlexibleWidth, QRect(30, 40, 140, 20)},
    AutoresizingCase{"FlexibleLeftAndHeight", R::FlexibleLeftMargin | R::FlexibleHeight, QRect(130, 40, 40, 120)},
    AutoresizingCase{"FlexibleRightAndBottom", R::FlexibleRightMargin | R::FlexibleBottomMargin, QRect(30, 40, 40, 20)}),
    [](const ::testing::TestParamInfo<AutoresizingCase> &info) { return std::string(info.param.name); });

TEST(AutoresizingTest, ACentredViewStaysCentredOverManyResizesAndAfterItsOwnerMovesIt)
{
    QWidget container;
    container.resize(201, 101);
    auto *view = new QWidget(&container);
    view->setGeometry(80, 40, 41, 21);
    setAutoresizingMask(view, kFlexibleMargins);
    container.show();
    for (int i = 0; i < 50; ++i)
        container.resize(203 + i * 17 % 400, 97 + i * 13 % 300);
    container.resize(1001, 601);
    EXPECT_EQ(view->geometry().center(), QPoint(500, 300));

    view->move(0, 0); // its owner's word counts from now on
    container.resize(2001, 601);
    EXPECT_EQ(view->geometry().topLeft(), QPoint(0, 0));
}

} // namespace
} // namespace zaf::ui
