#pragma once

// Transfers saved as JSON (format "vora-transfers", version 1; described in
// docs/transfer-json.md). Floats are written so that they read back to the
// same bits: a finite float as the exact decimal of its double value, a
// non-finite one as a string ("inf", "-inf", "nan:0x7fc00000").

#include <vora/vora.h>

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

namespace vora {
namespace cli {

constexpr int kTransferFormatVersion = 1;
constexpr const char* kTransferFormatName = "vora-transfers";
// The most face corrections (and faces) a transfers file may hold.
constexpr size_t kMaxFaceCorrections = 256;

struct TransferDocument {
    std::string tool = "vora " VORA_VERSION_STRING;
    std::string model;          // model directory the transfers came from, empty if none
    std::string photo;          // content photo as named on the command line
    uint64_t photoWidth = 0;
    uint64_t photoHeight = 0;
    std::string style;          // style image ("vora match"), empty otherwise
    std::string faceSource = "none";  // "auto", "given" or "none"
    std::vector<CFaceRect> faces;     // normalised, as passed to the library
    // The parameters used; the face array of the record is not kept (faces above).
    uint64_t numTransfers = 0;
    float rankingFactor = 1.0f;
    float solveFactor = 1.0f;
    float limitFactor = 1.0f;
    float finishFactor = 1.0f;
    std::vector<TRANSFER> transfers;
};

std::string SerializeTransfers(const TransferDocument& document);
// Throws Failure("<sourceName>: <what is wrong>") for anything but a valid document.
TransferDocument ParseTransfers(const std::string& text, const std::string& sourceName);

TransferDocument ReadTransfersFile(const std::string& path);

// "FILE.json:K" names record K of FILE.json; a plain name means record 0. A
// name that exists as a file as given is never split.
struct TransferReference {
    std::string path;
    long long index = 0;
    bool indexGiven = false;
};
TransferReference ParseTransferReference(const std::string& argument);

// Loads the referenced record; an index beyond the file's records is a usage error.
TRANSFER LoadTransferRecord(const TransferReference& reference, TransferDocument* documentOut = nullptr);

// Usage-free check before rendering: every float finite. Throws Failure naming the record.
void CheckRenderable(const TRANSFER& transfer, const std::string& where);

// Float encoding, exposed for tests.
std::string FloatToJsonText(float value);

}  // namespace cli
}  // namespace vora
