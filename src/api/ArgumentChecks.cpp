#include "api/ArgumentChecks.h"

#include "model/Engine.h"

namespace vora {

Status CheckProposalArguments(const Engine* engine, const IImage* content, size_t room, const VoraParameters& params) {
    if (engine == nullptr || content == nullptr || room < params.numTransfers) return STATUS_INVALID_ARGUMENT;
    // Style selection needs room for at least one choice.
    if (params.numTransfers == 0) return STATUS_NO_TRANSFERS_REQUESTED;
    if (!engine->CanRankStyles()) return STATUS_MODEL_INCOMPLETE;
    return STATUS_OK;
}

Status CheckStyleIndexArguments(const Engine* engine, const IImage* content, int styleIndex) {
    if (engine == nullptr || content == nullptr) return STATUS_INVALID_ARGUMENT;
    if (styleIndex < 0 || static_cast<size_t>(styleIndex) >= engine->styleRecords.size())
        return STATUS_STYLE_INDEX_OUT_OF_RANGE;
    return STATUS_OK;
}

Status CheckApplyArguments(const IImage* source, const IImage* destination) {
    if (source == nullptr || destination == nullptr) return STATUS_INVALID_ARGUMENT;
    if (source->GetWidth() == 0 || source->GetHeight() == 0) return STATUS_OK;
    if (source->GetConstData() == nullptr || destination->GetConstData() == nullptr) return STATUS_INVALID_ARGUMENT;
    // The destination is addressed with the source's strides: they must agree.
    if (destination->GetWidth() != source->GetWidth() || destination->GetHeight() != source->GetHeight() ||
        destination->GetRowStride() != source->GetRowStride() ||
        destination->GetPixelStride() != source->GetPixelStride()) {
        return STATUS_INVALID_ARGUMENT;
    }
    // Three colour bytes per pixel, and rows that do not overlap.
    const size_t pixelStride = source->GetPixelStride();
    if (pixelStride < 3 || source->GetWidth() > source->GetRowStride() / pixelStride) return STATUS_INVALID_ARGUMENT;
    return STATUS_OK;
}

}  // namespace vora
