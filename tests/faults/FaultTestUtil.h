#ifndef ULO_TESTS_FAULTTESTUTIL_H
#define ULO_TESTS_FAULTTESTUTIL_H
// Helpers of the fault tests: a file's bytes, and a body run in a child
// process as an unprivileged user.
#include <ftw.h>
#include <grp.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>
#include <fstream>
#include <functional>
#include <iterator>
#include <string>

// The fault tests' files live on tmpfs where there is one: the library
// syncs every commit, and these programs commit thousands of times.
inline const bool g_filesOnTmpfs = access("/dev/shm", W_OK) == 0 && setenv("TMPDIR", "/dev/shm", 1) == 0;

inline std::string FileBytes(const std::string& path)
{
    std::ifstream in(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>()};
}

// Runs body in a forked child and returns what it returned. Under root the
// child first gives dir (with everything in it) to nobody and becomes
// nobody, so that file permissions apply; it returns "skip: why" when that
// fails.
inline std::string InChild(const std::string& dir, const std::function<std::string()>& body)
{
    int fds[2];
    if (pipe(fds) != 0) {
        return "pipe failed";
    }
    const pid_t pid = fork();
    if (pid == 0) {
        close(fds[0]);
        constexpr uid_t kNobody = 65534;
        const auto give = [](const char* path, const struct stat*, int, FTW*) { return chown(path, kNobody, kNobody); };
        std::string out;
        if (getuid() == 0 &&
            (nftw(dir.c_str(), give, 8, FTW_PHYS) != 0 || setgid(kNobody) != 0 || setuid(kNobody) != 0 ||
             access(dir.c_str(), W_OK | X_OK) != 0)) {
            out = "skip: cannot run as nobody (uid 65534) in " + dir;
        } else {
            out = body();
        }
        const bool written = write(fds[1], out.data(), out.size()) == static_cast<ssize_t>(out.size());
        _exit(written ? 0 : 1);
    }
    close(fds[1]);
    std::string out;
    char buffer[4096];
    for (ssize_t n; (n = read(fds[0], buffer, sizeof buffer)) > 0;) {
        out.append(buffer, static_cast<std::size_t>(n));
    }
    close(fds[0]);
    int status = 0;
    waitpid(pid, &status, 0);
    return WIFEXITED(status) && WEXITSTATUS(status) == 0 ? out : "child failed: " + out;
}

#endif  // ULO_TESTS_FAULTTESTUTIL_H
