#pragma once

// What the publishing activity reads from the share sheet's activity items.
//
// Items by position, as the editor's share flow supplies them:
//   0  the share text          1  the store link (a string, possibly empty)      2  the movie's file URL
// With a host-supplied share message the flow passes only the message, the movie and perhaps an
// attachment. The movie always comes before the attachment, so the movie is the first local file of
// the list, and only when it plays: an attachment is never published in the recording's place, even
// when it is a movie itself. No position past the end of the list is ever read.
//
// Threads: any thread; nothing here reads a file.

#include <QString>
#include <QUrl>
#include <QVariantList>

namespace zaf::publishing {

// The text the publishing form's description starts with: the texts at positions 0 and 1 joined
// with one space when both are texts (an empty link leaves a trailing space), else the one that is.
QString descriptionForItems(const QVariantList &activityItems);
// The first local file URL of the list, the one item that may be the movie (it is the movie when it
// plays); empty when there is none. Reads no file.
QUrl movieCandidateInItems(const QVariantList &activityItems);

} // namespace zaf::publishing
