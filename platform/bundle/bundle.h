#pragma once

// Bundles: directories of resources with an information dictionary, localizations ("xx.lproj"
// sub-directories of the resource directory holding compiled gettext string tables, "TABLE.mo"),
// and applications found by identifier through their freedesktop desktop entries.
//
// Threads: every function may be called from any thread; bundles are immutable once opened (their
// tables are read on first use under a lock).
//
// A bundle reads its desktop entries through desktop_entry.h and picks its localization through
// localization_matching.h; the latter's functions (the user's languages, the order of localizations)
// are part of this API and come with this header.

#include "platform/bundle/localization_matching.h"

#include <QString>
#include <QStringList>
#include <QUrl>
#include <QVariantMap>

#include <memory>
#include <sys/types.h>

namespace zaf::bundle {

// Information-dictionary keys.
inline constexpr const char *kDisplayNameKey = "DisplayName";   // the desktop entry's Name
inline constexpr const char *kBundleNameKey = "BundleName";     // the executable's base name
inline constexpr const char *kIdentifierKey = "Identifier";     // the desktop-file ID without ".desktop"
inline constexpr const char *kExecutableKey = "Executable";     // the program the entry starts

class Bundle {
public:
    // A directory bundle: its information dictionary is read from "Info.desktop" in the directory
    // when present (a desktop entry; its optional key "X-Zaf-Identifier" is the bundle identifier);
    // its resource directory is "Resources" when present, else the directory itself. None when the
    // path is not a readable directory. A path to a desktop entry file opens that application's
    // bundle (the bundle path of an application bundle is its desktop entry).
    static std::shared_ptr<Bundle> bundleWithPath(const QString &path);
    static std::shared_ptr<Bundle> bundleWithURL(const QUrl &url);
    // An application's bundle by identifier: the desktop entry "ID.desktop" in the XDG data
    // directories' "applications" folders ($XDG_DATA_HOME, then $XDG_DATA_DIRS, in order; desktop-file
    // ID rules for sub-folders). None when no entry exists or it is not a valid application entry.
    static std::shared_ptr<Bundle> bundleWithIdentifier(const QString &identifier);
    // The bundle that contains an executable: the application whose desktop entry starts that
    // program (TryExec or the Exec program, resolved through PATH), else none.
    static std::shared_ptr<Bundle> bundleForExecutablePath(const QString &executablePath);

    QString bundlePath() const;
    QString bundleIdentifier() const;
    // The plain information dictionary, and the one localized for the user's languages (Desktop
    // Entry locale rules: Name[ll_CC@mod], Name[ll_CC], Name[ll@mod], Name[ll], in that order, for
    // each preferred language in turn). The localized dictionary holds only keys that have a
    // translation for those languages; it is computed on every call.
    QVariantMap infoDictionary() const;
    QVariantMap localizedInfoDictionary() const;
    QString resourcePath() const;
    // The localizations present ("en", "de", "pt_BR", ...): the names of the "*.lproj" folders.
    QStringList localizations() const;
    // The path of resource NAME.TYPE in a localization's folder, or in the resource directory when
    // `localization` is empty ("" when absent). String tables are stored compiled: a resource of type
    // "strings" is found as NAME.mo when NAME.strings does not exist.
    QString pathForResource(const QString &name, const QString &type, const QString &localization) const;
    // The translation of key in table TABLE ("Localizable" when empty) of this bundle's best
    // localization for the user's languages; when the table lacks the key: `value` when not empty,
    // else the key itself. A corrupt or missing table is an empty table (logged once). A bundle
    // without localizations (such as one opened on a "*.lproj" folder) reads TABLE.mo from its
    // resource directory.
    QString localizedStringForKey(const QString &key, const QString &value, const QString &table) const;

    ~Bundle();
    Bundle(const Bundle &) = delete;
    Bundle &operator=(const Bundle &) = delete;

private:
    Bundle();
    struct Private;
    std::unique_ptr<Private> d;
};

// The executable of a running process: /proc/PID/exe read into a 4096-byte buffer. Returns the
// length in bytes of the UTF-8 path decoded into `path` (0 when it cannot be read or does not fit the
// buffer). `path` may be null.
int executablePathOfProcess(pid_t pid, QString *path);

} // namespace zaf::bundle
