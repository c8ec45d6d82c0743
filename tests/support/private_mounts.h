#pragma once

// File systems of a test's own: a small tmpfs that fills up part-way through a write, or a
// read-only one. Mounting needs a private mount namespace, so such a test first runs itself again
// in a child made by `unshare --mount --propagation private` (where its mounts touch nothing of the
// machine's): `if (!insidePrivateMounts()) return runThisTestInPrivateMounts();`, then returns
// when its ScopedTmpfs is not mounted. Where the namespace cannot be made the test is skipped.

#include <QString>
#include <QtGlobal>

namespace zaf::test {

// True in the child process that runThisTestInPrivateMounts() started.
bool insidePrivateMounts();

// Runs the current test (by its full name) in a child process with a private mount namespace and
// takes over its outcome: a failure fails this test with the child's output, a skip skips it with
// the child's reason. Skips when the namespace cannot be made.
void runThisTestInPrivateMounts();

// A tmpfs of `bytes` bytes mounted at an existing directory, read-only when asked, for as long as
// this object lives (inside a private mount namespace only). A mount that fails skips the test,
// which then returns at once.
class ScopedTmpfs {
public:
    ScopedTmpfs(const QString &directory, qint64 bytes, bool readOnly = false);
    ~ScopedTmpfs();
    ScopedTmpfs(const ScopedTmpfs &) = delete;
    ScopedTmpfs &operator=(const ScopedTmpfs &) = delete;
    bool mounted() const { return m_mounted; }

private:
    QString m_directory;
    bool m_mounted = false;
};

} // namespace zaf::test
