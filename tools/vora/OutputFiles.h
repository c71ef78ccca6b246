#pragma once

// Writing outputs safely: a file appears complete or not at all (written to a
// temporary file in the same directory, then renamed over the target), an
// existing file is replaced only with --force, and an input is never written
// over without --force.

#include <string>
#include <vector>

namespace vora {
namespace cli {

// Usage error when output may not be written: it names an input (same file,
// however spelled), or it exists and force is false, or it is a directory.
// Failure when its directory does not exist.
void CheckOutputPath(const std::string& output, const std::vector<std::string>& inputs, bool force);

// Writes bytes to path through a temporary file and a rename. Throws Failure
// naming path; nothing is left behind on failure or on an interrupt. Unless
// replace is true, the final step never replaces a file: one that appeared at
// path while the command ran (after CheckOutputPath) is kept, and the write
// fails with "already exists".
void WriteFileAtomically(const std::string& path, const std::string& bytes, bool replace);

// Moves the finished file `from` to `to` in one step, on the same file
// system; without replace, fails (returns false, errno EEXIST) rather than
// replace a file at `to`.
bool MoveIntoPlace(const std::string& from, const std::string& to, bool replace);

// A hidden folder beside an output folder, where a command writes a set of
// files that must appear together or not at all. Commit moves them into the
// output folder (renaming the whole staging folder when the output folder does
// not exist yet); a failed or abandoned set, and an interrupt, leave nothing.
// One staging folder at a time.
class StagingFolder {
public:
    explicit StagingFolder(const std::string& outputFolder);
    ~StagingFolder();
    StagingFolder(const StagingFolder&) = delete;
    StagingFolder& operator=(const StagingFolder&) = delete;

    // Where to write the file `name` (no folders in it); it is then removed
    // on failure and moved on Commit.
    std::string PathFor(const std::string& name);

    // Moves every file into the output folder. Without replace, a file that
    // exists there is not replaced: the files already moved are taken back and
    // Failure names the one in the way.
    void Commit(bool replace);

private:
    std::string m_output;
    std::string m_folder;
    std::vector<std::string> m_names;
    bool m_committed = false;
};

}  // namespace cli
}  // namespace vora
