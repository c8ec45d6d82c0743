#pragma once

// Faults injected into the system calls of the atomic write, for the tests of platform_tests. The
// definitions in file_faults.cpp take the place of the C library's fsync(), renameat2(), write()
// and link() in that program; with no fault set they make the real system call.

namespace zaf::test {

struct Faults {
    int fileSync = 0;        // errno of fsync() on a file
    int directorySync = 0;   // errno of fsync() on a directory
    int renameat2 = 0;       // errno of renameat2()
    bool renameOnce = false; // only the first renameat2() fails
    int link = 0;            // errno of link()
    long spaceLeft = -1;     // bytes that writes into a ".partial-" temporary may still add before
                             // the disk is full (ENOSPC); -1: no limit
};

// Sets the faults for as long as it lives, and clears them when a test ends, whatever happens in it.
class FaultScope {
public:
    explicit FaultScope(Faults faults);
    ~FaultScope();
    FaultScope(const FaultScope &) = delete;
    FaultScope &operator=(const FaultScope &) = delete;
};

} // namespace zaf::test
