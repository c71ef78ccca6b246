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
// naming path; nothing is left behind on failure or on an interrupt.
void WriteFileAtomically(const std::string& path, const std::string& bytes);

}  // namespace cli
}  // namespace vora
