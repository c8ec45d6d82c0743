#pragma once

// Texts of the publishing flow, from the string tables of the photo-library component's bundle.

#include "platform/bundle/bundle.h"

#include <QString>

#include <memory>
#include <optional>

// The photo-library component's bundle: its installed data folder ($ZAF_PHOTO_LIBRARY_BUNDLE_PATH
// when set). Remembered once found; looked for again while it is missing.
std::shared_ptr<zaf::bundle::Bundle> ZafPhotoLibraryFrameworkBundle();

// The key's text from the component's tables, tried in order (device, main, two supplementary):
// the first text that differs from the key; the key itself when no table has it; none when the
// component's bundle is missing. A translation equal to the key counts as missing.
std::optional<QString> ZafLocalizedFrameworkString(const QString &key);
