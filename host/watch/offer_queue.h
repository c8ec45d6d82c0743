#pragma once

// The bookkeeping of `zaf-host --watch`: the files waiting for the editor, in the order they were
// finished, and the files the editor has been offered already.
//
// Threads: plain values without locks; the watch mode uses them on the main thread (and hands a
// copy of OfferedFiles to its worker).

#include "host/watch/movie_check.h"

#include <QList>
#include <QSet>
#include <QString>

#include <optional>

namespace zaf::host::watch {

// First in, first out, each path at most once: a file finished twice while it waits keeps its place.
class OfferQueue {
public:
    // Adds `path` at the back; false (nothing changes) when it is already waiting.
    bool push(const QString &path);
    // The path at the front, taken out; nullopt when nothing waits.
    std::optional<QString> pop();
    // Empties the queue; returns how many paths were waiting.
    qsizetype clear();

    qsizetype size() const { return m_paths.size(); }
    bool isEmpty() const { return m_paths.isEmpty(); }

private:
    QList<QString> m_paths;
};

// The versions of files offered so far, for the life of the watcher. Nothing is kept on disk: a new
// watcher acts only on files finished after it starts, so it has nothing to remember from before.
class OfferedFiles {
public:
    // True when this version of a file was offered already (under any name).
    bool contains(const FileIdentity &identity) const { return m_identities.contains(identity); }
    void remember(const FileIdentity &identity) { m_identities.insert(identity); }
    qsizetype size() const { return m_identities.size(); }

private:
    QSet<FileIdentity> m_identities;
};

} // namespace zaf::host::watch
