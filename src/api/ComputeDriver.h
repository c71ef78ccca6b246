#pragma once

#include <cstddef>
#include <vector>

#include <vora/vora.h>

namespace vora {

struct Engine;

// The compute operations behind the facade. The facade has checked the
// arguments (ArgumentChecks.h); what can still fail here comes from the model
// or the data: STATUS_MODEL_INCOMPLETE (the network gave no feature),
// STATUS_NO_USABLE_STYLE, STATUS_NON_FINITE_RESULT. Records are solved into
// copies, so a failed call leaves the caller's records as they were.

// Fills out[0..numTransfers-1]; out holds at least numTransfers records,
// numTransfers >= 1 and the engine can rank styles.
Status ComputeTransfers(const Engine& engine, const IImage& content, std::vector<TRANSFER>& out,
                        const VoraParameters& params);
Status ComputeTransferToStyleImage(const IImage& content, const IImage& style, TRANSFER& out,
                                   const VoraParameters& params);
// styleIndex is inside the engine's database.
Status ComputeTransferToStyleIndex(const Engine& engine, const IImage& content, size_t styleIndex, TRANSFER& out,
                                   const VoraParameters& params);

}  // namespace vora
