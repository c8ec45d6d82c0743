#include "overlay/flat_video_overlay_button.h"
#include "overlay/high_fidelity_video_overlay_button.h"
#include "overlay/overlay_images.h"
#include "overlay/video_overlay_button.h"
#include "tests/overlay/overlay_test_support.h"

#include <gtest/gtest.h>

#include <memory>
#include <optional>

namespace zaf::test {
namespace {

enum class Variant { Flat, HighFidelityWithBackdrop, HighFidelityWithoutBackdrop };

struct FactoryCase {
    const char *name;
    std::int64_t style;
    std::optional<int> graphicsQualityLevel; // none: the offscreen desktop's own answer (10)
    Variant expected;
};

class OverlayButtonFactory : public ::testing::TestWithParam<FactoryCase> {};

TEST_P(OverlayButtonFactory, StyleAndGraphicsQualityLevelPickTheVariant)
{
    const FactoryCase &c = GetParam();
    GraphicsQualityLevel device(c.graphicsQualityLevel);

    std::unique_ptr<ZafVideoOverlayButton> button(ZafVideoOverlayButtonFactory::_srVideoOverlayButtonWithStyle(c.style));
    ASSERT_NE(button, nullptr);
    EXPECT_EQ(button->style(), c.style);

    QWidget *widget = button->widget();
    ASSERT_NE(widget, nullptr);
    EXPECT_EQ(widget->parentWidget(), nullptr);
    EXPECT_EQ(widget->pos(), QPoint(0, 0));
    EXPECT_EQ(widget->size(), overlay::sizeInPoints(glyphMask()).toSize());

    auto *flat = dynamic_cast<ZafFlatVideoOverlayButton *>(button.get());
    auto *highFidelity = dynamic_cast<ZafHighFidelityVideoOverlayButton *>(button.get());
    switch (c.expected) {
    case Variant::Flat:
        EXPECT_NE(flat, nullptr);
        EXPECT_EQ(static_cast<QWidget *>(flat), widget);
        break;
    case Variant::HighFidelityWithBackdrop:
        ASSERT_NE(highFidelity, nullptr);
        EXPECT_EQ(static_cast<QWidget *>(highFidelity), widget);
        EXPECT_NE(highFidelity->_backdropView, nullptr);
        break;
    case Variant::HighFidelityWithoutBackdrop:
        ASSERT_NE(highFidelity, nullptr);
        EXPECT_EQ(highFidelity->_backdropView, nullptr);
        break;
    }
}

INSTANTIATE_TEST_SUITE_P(
    Styles, OverlayButtonFactory,
    ::testing::Values(
        FactoryCase{"DefaultStyleOnLevel10IsFlat", 0, 10, Variant::Flat},
        FactoryCase{"DefaultStyleOnSoftwareDesktopIsFlat", 0, std::nullopt, Variant::Flat},
        FactoryCase{"DefaultStyleOnLevel100HasBackdrop", 0, 100, Variant::HighFidelityWithBackdrop},
        FactoryCase{"DefaultStyleOnLevel11HasBackdrop", 0, 11, Variant::HighFidelityWithBackdrop},
        FactoryCase{"DefaultStyleOnLevel9HasBackdrop", 0, 9, Variant::HighFidelityWithBackdrop},
        FactoryCase{"DefaultStyleOnLevel0HasBackdrop", 0, 0, Variant::HighFidelityWithBackdrop},
        FactoryCase{"Style2OnLevel10IsFlat", 2, 10, Variant::Flat},
        FactoryCase{"Style2OnLevel100IsFlat", 2, 100, Variant::Flat},
        FactoryCase{"Style1OnLevel10IsPlainHighFidelity", 1, 10, Variant::HighFidelityWithoutBackdrop},
        FactoryCase{"Style1OnLevel100IsPlainHighFidelity", 1, 100, Variant::HighFidelityWithoutBackdrop},
        FactoryCase{"Style7OnLevel10IsPlainHighFidelity", 7, 10, Variant::HighFidelityWithoutBackdrop},
        FactoryCase{"Style3OnLevel100IsPlainHighFidelity", 3, 100, Variant::HighFidelityWithoutBackdrop},
        FactoryCase{"NegativeStyleOnLevel10IsPlainHighFidelity", -1, 10, Variant::HighFidelityWithoutBackdrop},
        FactoryCase{"LargestStyleKeepsItsValue", INT64_MAX, 10, Variant::HighFidelityWithoutBackdrop},
        FactoryCase{"SmallestStyleKeepsItsValue", INT64_MIN, 100, Variant::HighFidelityWithoutBackdrop}),
    [](const ::testing::TestParamInfo<FactoryCase> &info) { return std::string(info.param.name); });

} // namespace
} // namespace zaf::test
