#pragma once

// The model readers take paths: each fuzz input is written to a file in a
// folder of its own process (under /dev/shm when it exists, to stay off the disk).

#include <cstddef>
#include <cstdint>
#include <string>

namespace vora {
namespace fuzz {

// "<folder>/<name>" holding exactly the given bytes; the folder is made once
// per process and removed at exit.
std::string WriteInput(const std::string& name, const uint8_t* data, size_t size);
// The per-process folder, with a trailing separator.
const std::string& Folder();

}  // namespace fuzz
}  // namespace vora
