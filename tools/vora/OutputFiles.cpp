#include "vora/OutputFiles.h"

#include <atomic>
#include <cerrno>
#include <csignal>
#include <mutex>
#include <cstring>
#include <filesystem>
#include <system_error>

#include <fcntl.h>
#include <stdio.h>  // renameat2
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

// The staging folder and the names registered in it, for the same handler.
constexpr size_t kMaxStagedNames = 128;
char g_stagingFolder[4096];
char g_stagedNames[kMaxStagedNames][256];
std::atomic<size_t> g_stagedCount{0};
std::atomic<bool> g_staging{false};

// Async-signal-safe removal of what is staged: fixed buffers, unlink and rmdir only.
void RemoveStaged() {
    if (!g_staging.load()) return;
    char path[sizeof g_stagingFolder + 256 + 1];
    const size_t folderLength = std::strlen(g_stagingFolder);
    for (size_t i = 0; i < g_stagedCount.load(); ++i) {
        std::memcpy(path, g_stagingFolder, folderLength);
        path[folderLength] = '/';
        std::memcpy(path + folderLength + 1, g_stagedNames[i], std::strlen(g_stagedNames[i]) + 1);
        unlink(path);
    }
    rmdir(g_stagingFolder);
}

extern "C" void RemovePendingAndDie(int signalNumber) {
    if (g_pending.load()) unlink(g_pendingTemp);
    RemoveStaged();
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

bool MoveIntoPlace(const std::string& from, const std::string& to, bool replace) {
    if (replace) return rename(from.c_str(), to.c_str()) == 0;
    // One step that refuses an existing target; file systems without it get
    // a hard link (which refuses one too) and the name dropped after.
    if (renameat2(AT_FDCWD, from.c_str(), AT_FDCWD, to.c_str(), RENAME_NOREPLACE) == 0) return true;
    if (errno != EINVAL && errno != ENOSYS && errno != ENOTSUP) return false;
    if (link(from.c_str(), to.c_str()) != 0) return false;
    unlink(from.c_str());
    return true;
}

StagingFolder::StagingFolder(const std::string& outputFolder) : m_output(outputFolder) {
    InstallInterruptCleanup();
    if (g_staging.load()) throw Failure(outputFolder, "internal error: a second staging folder");
    fs::path output = fs::path(outputFolder).lexically_normal();
    if (output.filename().empty()) output = output.parent_path();
    fs::path parent = output.parent_path();
    if (parent.empty()) parent = ".";
    // The output folder may be several levels new; its parent is made now
    // (and kept), so the staging folder sits on the same file system.
    std::error_code made;
    fs::create_directories(parent, made);
    const std::string pattern = (parent / ("." + output.filename().string() + ".tmp-XXXXXX")).string();
    if (pattern.size() >= sizeof g_stagingFolder) throw Failure(outputFolder, "path too long");
    std::memcpy(g_stagingFolder, pattern.c_str(), pattern.size() + 1);
    if (mkdtemp(g_stagingFolder) == nullptr)
        throw Failure(outputFolder, "cannot make a folder in " + parent.string() + " (" + ErrnoText(errno) + ")");
    m_folder = g_stagingFolder;
    g_stagedCount.store(0);
    g_staging.store(true);
}

StagingFolder::~StagingFolder() {
    if (!m_committed) RemoveStaged();
    g_staging.store(false);
}

std::string StagingFolder::PathFor(const std::string& name) {
    if (name.empty() || name.size() >= sizeof g_stagedNames[0] || name.find('/') != std::string::npos)
        throw Failure(m_output, "cannot stage the file name " + name);
    const size_t count = g_stagedCount.load();
    if (count == kMaxStagedNames) throw Failure(m_output, "too many files to stage");
    std::memcpy(g_stagedNames[count], name.c_str(), name.size() + 1);
    g_stagedCount.store(count + 1);
    m_names.push_back(name);
    return m_folder + "/" + name;
}

void StagingFolder::Commit(bool replace) {
    std::error_code ec;
    // A new output folder: the whole set appears in one rename. Only an
    // absent folder is replaced this way (rename also takes an empty one).
    if (!fs::exists(m_output, ec) && rename(m_folder.c_str(), m_output.c_str()) == 0) {
        m_committed = true;
        return;
    }
    if (!fs::is_directory(m_output, ec)) fs::create_directories(m_output, ec);
    if (!fs::is_directory(m_output, ec)) throw Failure(m_output, "cannot make the output folder");
    std::vector<std::string> moved;
    for (const std::string& name : m_names) {
        const std::string from = m_folder + "/" + name, to = (fs::path(m_output) / name).string();
        if (MoveIntoPlace(from, to, replace)) {
            moved.push_back(name);
            continue;
        }
        const int error = errno;
        // Take back what was moved (nothing it replaced: without replace nothing was).
        for (const std::string& back : moved)
            MoveIntoPlace((fs::path(m_output) / back).string(), m_folder + "/" + back, false);
        if (error == EEXIST)
            throw Failure(to, "already exists (it appeared while this command ran); nothing was written (use --force)");
        throw Failure(to, "cannot write (" + ErrnoText(error) + "); nothing was written");
    }
    rmdir(m_folder.c_str());
    m_committed = true;
}

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

void WriteFileAtomically(const std::string& path, const std::string& bytes, bool replace) {
    // One file at a time: the interrupt handler knows a single pending name.
    static std::mutex oneAtATime;
    const std::lock_guard<std::mutex> lock(oneAtATime);
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
    if (!MoveIntoPlace(g_pendingTemp, path, replace)) {
        if (errno == EEXIST) abandon("already exists (it appeared while this command ran); refusing to replace it (use --force)");
        abandon("cannot write (" + ErrnoText(errno) + ")");
    }
    g_pending.store(false);
}

}  // namespace cli
}  // namespace vora
