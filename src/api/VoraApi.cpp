// The facade: a pointer to the engine and forwarding, nothing else.
#include <vora/vora.h>

#include <memory>
#include <new>

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
    return ComputeTransfers(engine, content, out, params);
}

Status vora_api::compute_transfers(const IImage* content, TRANSFER* out, const VoraParameters& params) const {
    return ComputeTransfersArray(engine, content, out, params);
}

Status vora_api::compute_transfer(const IImage* content, const IImage* style, TRANSFER& out,
                                  const VoraParameters& params) const {
    return ComputeTransferToStyleImage(content, style, out, params);
}

Status vora_api::compute_transfer(const IImage* content, int styleIndex, TRANSFER& out,
                                  const VoraParameters& params) const {
    return ComputeTransferToStyleIndex(engine, content, styleIndex, out, params);
}

Status vora_api::apply_transfer(const IImage* source, const TRANSFER& transfer, IImage* destination) const {
    return ApplyTransfer(source, transfer, destination);
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
