#pragma once

// Desktop entries (freedesktop ".desktop" files) as bundles read them: one entry's name, program,
// identifier and translated names, and where the applications' entries live (the "applications"
// folders of the XDG data directories) with the desktop-file IDs they give.
//
// Threads: any thread. An entry is immutable once read; its translations are read under a lock of
// its own.

#include <QString>
#include <QStringList>

#include <functional>
#include <memory>
#include <optional>

namespace zaf::bundle {

class DesktopEntry {
public:
    enum class Requirement {
        AnyEntry,    // any entry with a [Desktop Entry] group (a bundle's information dictionary)
        Application, // Type "Application" with a Name
    };

    // Reads the entry at `path`. A file that cannot be read, has no [Desktop Entry] group, has a
    // malformed Exec line or fails the requirement gives none and a logged error naming the path.
    static std::optional<DesktopEntry> read(const QString &path, Requirement requirement);

    DesktopEntry(DesktopEntry &&other) noexcept;
    DesktopEntry &operator=(DesktopEntry &&other) noexcept;
    ~DesktopEntry();

    // Name, untranslated ("" when absent).
    QString name() const;
    // X-Zaf-Identifier, a directory bundle's identifier ("" when absent).
    QString identifier() const;
    // The Exec line's program and TryExec, each resolved through PATH (a bare name PATH does not
    // hold stays bare).
    QString program() const;
    QString tryExec() const;
    // The program the entry starts: the Exec program, else TryExec.
    QString executable() const;
    // Name translated for the first of `languages` (BCP 47 tags, best first) that has a translation,
    // by the Desktop Entry locale rules: Name[ll_CC@mod], Name[ll_CC], Name[ll@mod], Name[ll]. ""
    // when none of them has one.
    QString localizedName(const QStringList &languages) const;

private:
    DesktopEntry();
    struct Private;
    std::unique_ptr<Private> d;
};

// The "applications" folders of the XDG data directories in precedence order: $XDG_DATA_HOME
// (default ~/.local/share), then each of $XDG_DATA_DIRS (default /usr/local/share:/usr/share).
QStringList applicationDirectories();
// The entry file of the desktop-file ID `identifier` (without ".desktop"): in each folder in turn,
// "ID.desktop", else an entry in a sub-folder whose ID it is ("vendor-tool" from
// "vendor/tool.desktop"). "" when no folder has one.
QString applicationEntryPath(const QString &identifier);
// The desktop-file ID of the entry file at `path`: its path below the applications folder holding
// it, "/" turned into "-", without ".desktop"; for a file outside those folders its file name.
QString desktopFileIdOfEntry(const QString &path);
// Calls `visit` with the path of every entry of the applications folders, in precedence order,
// skipping an entry whose ID an earlier folder supplied; stops when `visit` returns true.
void forEachApplicationEntry(const std::function<bool(const QString &path)> &visit);

} // namespace zaf::bundle
