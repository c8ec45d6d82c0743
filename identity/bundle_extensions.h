#pragma once

// Bundle operations of the recording framework: its bundle and the localization that suits the
// user's languages, text lookup by key with a fixed chain of fallbacks, application names from
// bundles (by bundle, identifier or process), and the base of a dotted identifier.
//
// Threads: any thread. The framework bundle is opened once per process (safe under concurrent
// first calls); everything else is computed afresh on each call, so a change of the user's
// languages takes effect on the next lookup.

#include "platform/bundle/bundle.h"

#include <QString>

#include <memory>
#include <optional>
#include <sys/types.h>

struct ZafBundleExtensions {
    using Bundle = zaf::bundle::Bundle;

    // The bundle's display name: the localized display name, else the display name, else the
    // bundle name, else "" (never none).
    static QString _zafLocalizedAppName(const Bundle &bundle);
    // The framework bundle: the directory fixed at build time ($ZAF_FRAMEWORK_BUNDLE_PATH when set,
    // read once), or none when nothing usable is there.
    static std::shared_ptr<Bundle> _zafFrameworkBundle();
    // The display name of the application with that identifier; none when no bundle is found.
    static std::optional<QString> _zafLocalizedAppNameFromBundleID(const QString &bundleIdentifier);
    // The key's text in the "Localizable" table of, in order, the best localization folder, the
    // primary-language folder, the framework bundle itself; the first bundle that exists answers
    // (with the key itself when its table lacks it). None when all three are missing.
    static std::optional<QString> _zafLocalizedStringFromFrameworkBundleWithKey(const QString &key);
    // The framework's localization folder that best suits the user's languages, as a bundle.
    static std::shared_ptr<Bundle> localizedBundle();
    // The framework's folder for the first preferred language without region or script.
    static std::shared_ptr<Bundle> fallbackBundle();
    // "a.b.c" -> "a.b"; "a" -> ""; "a.b." -> "a.b".
    static QString baseIdentifier(const QString &identifier);
    // The bundle of a running process's application, or none.
    static std::shared_ptr<Bundle> bundleWithPID(pid_t pid);
};
