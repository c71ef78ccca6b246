// The transfers JSON reader of the command-line tool. Every fault must be the
// tool's own Failure with the file's name; any other exception is a finding.
#include <cstddef>
#include <cstdint>
#include <string>

#include "vora/Cli.h"
#include "vora/TransferJson.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    const std::string text(reinterpret_cast<const char*>(data), size);
    try {
        const vora::cli::TransferDocument document = vora::cli::ParseTransfers(text, "fuzz.json");
        // What the writer gives back must read again to the same text.
        const std::string written = vora::cli::SerializeTransfers(document);
        if (vora::cli::SerializeTransfers(vora::cli::ParseTransfers(written, "again.json")) != written)
            __builtin_trap();
    } catch (const vora::cli::Failure& failure) {
        if (std::string(failure.what()).rfind("fuzz.json", 0) != 0) __builtin_trap();
    }
    return 0;
}
