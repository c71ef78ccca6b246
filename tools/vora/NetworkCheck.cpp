#include "vora/NetworkCheck.h"

#include <memory>
#include <new>
#include <string>
#include <vector>

#include <opencv2/core.hpp>

#include <vora/vora.h>

#include "model/FeatureNetwork.h"
#include "vora/Library.h"
#include "vora/ModelChoice.h"
#include "vora/ModelFiles.h"

namespace vora {
namespace cli {

namespace {

// A small picture with some of everything (gradients, a face-sized blob of
// skin tone) for the network and the ranking to work on.
cv::Mat TestPicture() {
    cv::Mat rgb(96, 128, CV_8UC3);
    for (int y = 0; y < rgb.rows; ++y)
        for (int x = 0; x < rgb.cols; ++x) {
            uint8_t* p = rgb.ptr<uint8_t>(y) + 3 * x;
            p[0] = static_cast<uint8_t>(40 + 2 * x % 200);
            p[1] = static_cast<uint8_t>(60 + (x + y) % 150);
            p[2] = static_cast<uint8_t>(200 - y);
        }
    return rgb;
}

// Runs step; a failure of the libraries becomes a problem of the model,
// worded "<what>: <reason>", and false. Running out of memory is the
// machine's problem, not the model's: it goes on to the command's handler.
template <typename Step>
bool Succeeds(ModelExamination& model, const std::string& what, Step&& step) {
    try {
        step();
        return true;
    } catch (const cv::Exception& e) {
        model.problems.push_back(what + ": " + e.err);
    } catch (const std::bad_alloc&) {
        throw;
    } catch (const std::exception& e) {
        model.problems.push_back(what + ": " + e.what());
    }
    return false;
}

}  // namespace

std::string CheckModelNetwork(ModelExamination& model) {
    if (!model.definition.present || !model.weights.present) return "network: not loaded (files missing)";
    const std::string notLoading = "the network does not load";
    if (model.broken()) {
        // The facade would read the broken data files too; the network alone
        // tells whether it loads.
        const auto load = [&model] { (void)FeatureNetwork::Load(model.definition.path, model.weights.path); };
        if (!Succeeds(model, notLoading, load)) return "network: does not load";
        return "network: loads (no test computation: the data files are broken)";
    }
    std::unique_ptr<vora_api> api;
    if (!Succeeds(model, notLoading, [&] { api = std::make_unique<vora_api>(WithTrailingSlash(model.dir)); }))
        return "network: does not load";

    cv::Mat rgb = TestPicture();
    ImageHandle image = WrapWholeImage(rgb);
    VoraParameters params;
    params.numTransfers = 1;
    std::vector<TRANSFER> out(1);
    Status status = STATUS_OK;
    if (!Succeeds(model, "the network fails on a test picture",
                  [&] { status = api->compute_transfers(image.get(), out, params); }))
        return "network: loads, but fails on a test picture";
    if (status == STATUS_MODEL_INCOMPLETE) {
        // The data files were found complete and in agreement above, so the
        // library's "incomplete" can only mean a short feature.
        model.problems.push_back("the network does not give the 512 values the library needs");
        return "network: loads, but its feature is too short";
    }
    if (status != STATUS_OK) {
        model.problems.push_back("a test computation fails: " + StatusText(status));
        return "network: loads, but a test computation fails";
    }
    return "network: loads and gives 512 values; a test picture was matched to cluster " +
           std::to_string(out[0].clusterIndex) + " and given style " + std::to_string(out[0].styleIndex);
}

}  // namespace cli
}  // namespace vora
