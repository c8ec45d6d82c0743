#pragma once

// The numbers and image names shared by both overlay play buttons.
//
// The gray level and the glyph alpha are single-precision values widened to double, so that the
// pressed and rest looks compare equal to what the drawing code and the tests compute from them.

// Gray level (0 black, 1 white) of the flat button's background fill.
inline constexpr double ZafVideoOverlayFlatBackgroundWhite = double(0.96f);
// Alpha of the flat button's background fill.
inline constexpr double ZafVideoOverlayFlatBackgroundAlpha = double(0.96f);
// Alpha of the play glyph at rest.
inline constexpr double ZafVideoOverlayDefaultGlyphAlpha = double(0.3f);
// Alpha of the play glyph while the button is pressed.
inline constexpr double ZafVideoOverlayHighlightedGlyphAlpha = 0.5;

// Names of the mask images (resources of the overlay library, see overlay_images.h).
inline constexpr const char ZafVideoOverlayBackgroundMaskImageName[] = "ZafVideoOverlayBackgroundMask";
inline constexpr const char ZafVideoOverlayGlyphMaskImageName[] = "ZafVideoOverlayGlyphMask";
