#pragma once

// Choosing among a bundle's localizations for the user: the user's preferred languages, and the
// order in which a list of localizations serves them.
//
// Threads: any thread.

#include <QString>
#include <QStringList>

namespace zaf::bundle {

// The localization the texts are written in before translation.
inline constexpr const char *kDevelopmentLocalization = "en";

// The user's preferred languages, best first, as BCP 47 tags ("de-CH", "en"): QLocale::uiLanguages
// (which honours LANGUAGE and LANG); the C and POSIX locales count as the development language.
QStringList preferredLanguages();
// Tests only: makes preferredLanguages() return `languages` instead (an empty list restores the
// system's). Qt reads LANG once per process, so tests cannot switch languages through it.
void setPreferredLanguagesForTesting(const QStringList &languages);
// The localizations ordered by how well they serve the preferences (ICU's LocaleMatcher), best
// first; localizations that serve no preference follow, the development localization first and the
// others in their given order.
QStringList preferredLocalizationsFromArray(const QStringList &localizations, const QStringList &preferences);

} // namespace zaf::bundle
