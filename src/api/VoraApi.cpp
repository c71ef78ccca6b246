// The facade: a pointer to the engine, the checks at the door, and forwarding.
#include <vora/vora.h>

#include <algorithm>
#include <cstdint>
#include <memory>
#include <new>

#include "api/ArgumentChecks.h"
#include "api/ComputeDriver.h"
#include "color/ApplyTransfer.h"
#include "model/Engine.h"
#include "model/UserStyles.h"

namespace vora {

namespace {
const char* const kDefaultModelDir = "./model/";
}  // namespace

vora_api::vora_api() : vora_api(std::string(kDefaultModelDir)) {}

// A null directory reads as the default one rather than faulting.
vora_api::vora_api(const char* modelDir) : vora_api(std::string(modelDir ? modelDir : kDefaultModelDir)) {}

vora_api::vora_api(const std::string& modelDir) : engine(nullptr) {
    // Owned until loading has succeeded, so an unreadable network leaks nothing.
    auto loaded = std::make_unique<Engine>();
    loaded->LoadModel(modelDir);
    engine = loaded.release();
}

vora_api::~vora_api() {
    delete engine;
    engine = nullptr;
}

// Shares the engine without counting: the host destroys only one of the two.
vora_api& vora_api::operator=(const vora_api& other) {
    engine = other.engine;
    return *this;
}

Status vora_api::compute_transfers(const IImage* content, std::vector<TRANSFER>& out,
                                   const VoraParameters& params) const {
    const Status checked = CheckProposalArguments(engine, content, out.size(), params);
    if (checked != STATUS_OK) return checked;
    return ComputeTransfers(*engine, *content, out, params);
}

Status vora_api::compute_transfers(const IImage* content, TRANSFER* out, const VoraParameters& params) const {
    // Refused before the working vector is sized, so a bad call allocates nothing.
    const Status checked = out ? CheckProposalArguments(engine, content, SIZE_MAX, params) : STATUS_INVALID_ARGUMENT;
    if (checked != STATUS_OK) return checked;
    std::vector<TRANSFER> records(params.numTransfers);
    // A count without an array means no faces; sizing by it would only allocate.
    const size_t faces = params.isVoraParameterHavingFaces() ? params.numFaceRects : 0;
    for (TRANSFER& record : records) record.faceCorrections.assign(faces, FaceCorrection{});
    const Status status = ComputeTransfers(*engine, *content, records, params);
    if (status != STATUS_OK) return status;
    std::move(records.begin(), records.end(), out);
    return STATUS_OK;
}

Status vora_api::compute_transfer(const IImage* content, const IImage* style, TRANSFER& out,
                                  const VoraParameters& params) const {
    if (content == nullptr || style == nullptr) return STATUS_INVALID_ARGUMENT;
    return ComputeTransferToStyleImage(*content, *style, out, params);
}

Status vora_api::compute_transfer(const IImage* content, int styleIndex, TRANSFER& out,
                                  const VoraParameters& params) const {
    const Status checked = CheckStyleIndexArguments(engine, content, styleIndex);
    if (checked != STATUS_OK) return checked;
    return ComputeTransferToStyleIndex(*engine, *content, static_cast<size_t>(styleIndex), out, params);
}

Status vora_api::apply_transfer(const IImage* source, const TRANSFER& transfer, IImage* destination) const {
    const Status checked = CheckApplyArguments(source, destination);
    if (checked != STATUS_OK) return checked;
    ApplyTransfer(source, transfer, destination);
    return STATUS_OK;
}

// User styles are a placeholder interface; index is left as the caller set it.
Status vora_api::add_style(const IImage* style, int& /*index*/) {
    if (!style) return STATUS_INVALID_ARGUMENT;
    AddUserStyle(style);
    return STATUS_OK;
}

Status vora_api::remove_style(const int& /*index*/) { return STATUS_OK; }

Status vora_api::customize_style_preference(const std::vector<int>& /*preference*/) { return STATUS_OK; }

extern "C" {

vora_api* CreateVoraObj(const char* modelDir) { return new (std::nothrow) vora_api(modelDir); }

void DestroyVoraObj(vora_api* obj) { delete obj; }

Status compute_transfers(vora_api* obj, const IImage* content, TRANSFER* out, const VoraParameters* params) {
    if (!obj || !params) return STATUS_INVALID_ARGUMENT;
    return obj->compute_transfers(content, out, *params);
}

Status apply_transfer(vora_api* obj, const IImage* source, const TRANSFER* transfer, IImage* destination) {
    if (!obj || !transfer) return STATUS_INVALID_ARGUMENT;
    return obj->apply_transfer(source, *transfer, destination);
}

}  // extern "C"

}  // namespace vora
