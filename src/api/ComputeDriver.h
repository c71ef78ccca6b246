#pragma once

#include <vector>

#include <vora/vora.h>

namespace vora {

struct Engine;

// The four compute operations of the facade. Input outside the contract is
// refused with a failure status before any work, and nothing is written.
Status ComputeTransfers(const Engine* engine, const IImage* content, std::vector<TRANSFER>& out,
                        const VoraParameters& params);
Status ComputeTransfersArray(const Engine* engine, const IImage* content, TRANSFER* out,
                             const VoraParameters& params);
Status ComputeTransferToStyleImage(const IImage* content, const IImage* style, TRANSFER& out,
                                   const VoraParameters& params);
Status ComputeTransferToStyleIndex(const Engine* engine, const IImage* content, int styleIndex, TRANSFER& out,
                                   const VoraParameters& params);

}  // namespace vora
