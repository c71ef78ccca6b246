#include "vora/OutputFiles.h"

#include <atomic>
#include <cerrno>
#include <csignal>
#include <cstring>
#include <filesystem>
#include <system_error>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include "vora/Cli.h"

namespace vora {
namespace cli {
namespace {

namespace fs = std::filesystem;

// The temporary file being written, removed by the signal handler if the user
// interrupts: a fixed buffer, because a handler may only touch plain memory.
char g_pendingTemp[4096];
std::atomic<bool> g_pending{false};

extern "C" void RemovePendingAndDie(int signalNumber) {
    if (g_pending.load()) unlink(g_pendingTemp);
    std::signal(signalNumber, SIG_DFL);
    std::raise(signalNumber);
}

void InstallInterruptCleanup() {
    static bool installed = false;
    if (installed) return;
    installed = true;
    struct sigaction action {};
    action.sa_handler = RemovePendingAndDie;
    sigemptyset(&action.sa_mask);
    for (int s : {SIGINT, SIGTERM, SIGHUP}) sigaction(s, &action, nullptr);
}

std::string ErrnoText(int error) { return std::strerror(error); }

}  // namespace

void CheckOutputPath(const std::string& output, const std::vector<std::string>& inputs, bool force) {
    std::error_code ec;
    const fs::path path(output);
    if (output.empty()) throw UsageError("an output file name is empty");
    if (fs::is_directory(path, ec)) throw UsageError(output + ": is a directory; give a file name");
    for (const std::string& input : inputs) {
        if (input.empty()) continue;
        const bool same = fs::exists(path, ec) && fs::exists(input, ec) && fs::equivalent(path, input, ec);
        if (same && !force)
            throw UsageError(output + ": is an input of this command; refusing to write over it (use --force)");
    }
    if (fs::exists(path, ec) && !force)
        throw UsageError(output + ": already exists; refusing to replace it (use --force)");
    fs::path parent = path.parent_path();
    if (parent.empty()) parent = ".";
    if (!fs::is_directory(parent, ec)) throw Failure(output, "its folder " + parent.string() + " does not exist");
}

void WriteFileAtomically(const std::string& path, const std::string& bytes) {
    InstallInterruptCleanup();
    const fs::path target(path);
    fs::path folder = target.parent_path();
    if (folder.empty()) folder = ".";
    const std::string pattern = (folder / ("." + target.filename().string() + ".tmp-XXXXXX")).string();
    if (pattern.size() >= sizeof g_pendingTemp) throw Failure(path, "path too long");

    std::memcpy(g_pendingTemp, pattern.c_str(), pattern.size() + 1);
    // Block the handled signals while the name is being registered, so the
    // handler never sees a file that mkstemp has not made yet or a stale name.
    sigset_t block, previous;
    sigemptyset(&block);
    for (int s : {SIGINT, SIGTERM, SIGHUP}) sigaddset(&block, s);
    sigprocmask(SIG_BLOCK, &block, &previous);
    const int fd = mkstemp(g_pendingTemp);
    const int openError = errno;
    if (fd >= 0) g_pending.store(true);
    sigprocmask(SIG_SETMASK, &previous, nullptr);
    if (fd < 0) throw Failure(path, "cannot create a file in " + folder.string() + " (" + ErrnoText(openError) + ")");

    auto abandon = [&](const std::string& what) {
        sigprocmask(SIG_BLOCK, &block, &previous);
        unlink(g_pendingTemp);
        g_pending.store(false);
        sigprocmask(SIG_SETMASK, &previous, nullptr);
        throw Failure(path, what);
    };

    // mkstemp makes the file private; give it the usual permissions instead.
    const mode_t mask = umask(0);
    umask(mask);
    fchmod(fd, 0666 & ~mask);

    size_t written = 0;
    while (written < bytes.size()) {
        const ssize_t n = write(fd, bytes.data() + written, bytes.size() - written);
        if (n < 0) {
            if (errno == EINTR) continue;
            const int error = errno;
            close(fd);
            abandon("cannot write (" + ErrnoText(error) + ")");
        }
        written += static_cast<size_t>(n);
    }
    if (close(fd) != 0) abandon("cannot write (" + ErrnoText(errno) + ")");
    if (rename(g_pendingTemp, path.c_str()) != 0) abandon("cannot write (" + ErrnoText(errno) + ")");
    g_pending.store(false);
}

}  // namespace cli
}  // namespace vora
