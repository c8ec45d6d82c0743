#pragma once

// The two date operations of the editor's title: the creation date of a movie file, and its text.

#include <QDateTime>
#include <QUrl>

#include <optional>

struct ZafDateExtensions {
    // The creation (birth) date of the file at a URL, read on the caller's thread; none when its
    // attributes cannot be read. No error is reported.
    static std::optional<QDateTime> _srGetCreationDateForFile(const QUrl &fileURL);
    // "MMMM d hh:mm a" in the user's locale and time zone (e.g. "November 16 04:47 PM"); a missing
    // date gives no text.
    static QString _srGetStringFromDate(const std::optional<QDateTime> &date);
};
