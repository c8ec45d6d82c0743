#include "overlay/video_overlay_button.h"

#include "overlay/flat_video_overlay_button.h"
#include "overlay/high_fidelity_video_overlay_button.h"
#include "platform/capability/capability_service.h"

namespace {

// The graphics-quality level of devices that only render in software: they get the flat button.
constexpr std::int32_t kSoftwareGraphicsQualityLevel = 10;

} // namespace

ZafVideoOverlayButton *ZafVideoOverlayButtonFactory::_srVideoOverlayButtonWithStyle(std::int64_t style)
{
    bool flat;
    if (style == 2)
        flat = true;
    else if (style == 0)
        flat = zaf::CapabilityService::shared().graphicsQualityLevel() == kSoftwareGraphicsQualityLevel;
    else
        flat = false;
    if (flat)
        return new ZafFlatVideoOverlayButton(style);
    return new ZafHighFidelityVideoOverlayButton(style);
}
