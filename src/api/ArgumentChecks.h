#pragma once

#include <cstddef>
#include <cstdint>

#include <vora/vora.h>

namespace vora {

struct Engine;

// The library's checks at the door. Every entry point of the facade runs one
// of these before any work; the layers below take what they establish as given
// and assert it in debug builds. Each returns STATUS_OK or the failure the
// caller gets, having touched nothing.

// compute_transfers: an engine and a content image, room for the records
// (`room`: the caller's vector size; the array form passes SIZE_MAX once its
// pointer is known to be non-null), at least one transfer requested, and a
// model that can rank styles. Failures in that order of precedence:
// STATUS_INVALID_ARGUMENT, STATUS_NO_TRANSFERS_REQUESTED, STATUS_MODEL_INCOMPLETE.
Status CheckProposalArguments(const Engine* engine, const IImage* content, size_t room, const VoraParameters& params);

// compute_transfer with a database style: STATUS_INVALID_ARGUMENT for a null
// engine or content, STATUS_STYLE_INDEX_OUT_OF_RANGE for an index outside the
// database.
Status CheckStyleIndexArguments(const Engine* engine, const IImage* content, int styleIndex);

// apply_transfer: STATUS_INVALID_ARGUMENT for input that would be read or
// written out of bounds (a null source or destination object; and, for a
// source with pixels, a null pixel pointer on either side, a destination whose
// width, height, row stride or pixel stride differs from the source's, a pixel
// stride below 3, or rows closer than a row of pixels). A source with zero rows
// or columns passes: apply then reads and writes nothing.
Status CheckApplyArguments(const IImage* source, const IImage* destination);

}  // namespace vora
