#include "tests/platform/file_faults.h"

#include <algorithm>
#include <cerrno>
#include <fcntl.h>
#include <string>
#include <string_view>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

namespace {

zaf::test::Faults faults;

int fail(int errnum)
{
    errno = errnum;
    return -1;
}

// Whether a descriptor is open on an atomic write's temporary file.
bool writesATemporary(int fd)
{
    char target[4096];
    const std::string link = "/proc/self/fd/" + std::to_string(fd);
    const ssize_t n = ::readlink(link.c_str(), target, sizeof target - 1);
    return n > 0 && std::string_view(target, size_t(n)).find(".partial-") != std::string_view::npos;
}

} // namespace

extern "C" int fsync(int fd)
{
    struct stat st;
    const bool directory = ::fstat(fd, &st) == 0 && S_ISDIR(st.st_mode);
    if (const int err = directory ? faults.directorySync : faults.fileSync)
        return fail(err);
    return int(::syscall(SYS_fsync, fd));
}

extern "C" int renameat2(int fromDir, const char *from, int toDir, const char *to, unsigned int flags) __THROW
{
    if (const int err = faults.renameat2) {
        if (faults.renameOnce)
            faults.renameat2 = 0;
        return fail(err);
    }
    return int(::syscall(SYS_renameat2, fromDir, from, toDir, to, flags));
}

extern "C" ssize_t write(int fd, const void *buffer, size_t size)
{
    if (faults.spaceLeft >= 0 && writesATemporary(fd)) {
        if (faults.spaceLeft == 0)
            return fail(ENOSPC);
        size = std::min(size, size_t(faults.spaceLeft));
        faults.spaceLeft -= long(size);
    }
    return ::syscall(SYS_write, fd, buffer, size);
}

extern "C" int link(const char *from, const char *to) __THROW
{
    return faults.link ? fail(faults.link) : int(::syscall(SYS_linkat, AT_FDCWD, from, AT_FDCWD, to, 0));
}

namespace zaf::test {

FaultScope::FaultScope(Faults f)
{
    faults = f;
}

FaultScope::~FaultScope()
{
    faults = {};
}

} // namespace zaf::test
