#include "api/ComputeDriver.h"

#include <array>
#include <cstdint>

#include <opencv2/core.hpp>

#include "color/WorkingOrder.h"
#include "model/Engine.h"
#include "semantic/NetworkInput.h"
#include "semantic/StyleRanking.h"
#include "transfer/ColourStatistics.h"
#include "transfer/FinishTransfer.h"
#include "transfer/SolveTransfer.h"

namespace vora {

namespace {

// Converts an image to working Lab and summarises it. The matrix of B, G, R
// bytes is returned too: the network reads it.
struct AnalysedImage {
    cv::Mat bgr8;
    cv::Mat lab;
    ColourStats stats{};
};

AnalysedImage Analyse(const IImage* image) {
    AnalysedImage result;
    result.bgr8 = ToWorkingOrder(image);
    result.lab.create(result.bgr8.rows, result.bgr8.cols, CV_32FC3);
    ConvertToLab(result.bgr8, result.lab);
    ComputeChromaStats(result.lab, result.stats);
    ComputeLightnessStats(result.lab, result.stats);
    return result;
}

}  // namespace

Status ComputeTransfers(const Engine* engine, const IImage* content, std::vector<TRANSFER>& out,
                        const VoraParameters& params) {
    if (!engine || !content || out.size() < params.numTransfers) return STATUS_INVALID_ARGUMENT;
    if (params.numTransfers == 0) return STATUS_NO_TRANSFERS_REQUESTED;
    if (!engine->CanRankStyles()) return STATUS_MODEL_INCOMPLETE;

    const AnalysedImage analysed = Analyse(content);

    std::array<float, 512> feature{};
    // A second header over the same pixels: the network input is prepared from it.
    const cv::Mat shared = analysed.bgr8;
    if (!ExtractFeature(*engine->network, shared, feature.data())) return STATUS_MODEL_INCOMPLETE;

    std::vector<int32_t> clusterOrder(engine->clusterCentres.size(), 0);
    OrderClusters(*engine, feature.data(), clusterOrder);

    std::vector<int32_t> chosenClusters;
    std::vector<int32_t> chosenStyles;
    const Status selected =
        SelectStyles(*engine, analysed.stats, clusterOrder, chosenClusters, chosenStyles, params);
    if (selected != STATUS_OK) return selected;

    for (uint32_t i = 0; i < params.numTransfers; ++i) {
        TRANSFER& record = out[i];
        record.clusterIndex = chosenClusters[i];
        record.styleIndex = chosenStyles[i];
        SolveTransfer(analysed.stats, engine->styleRecords[chosenStyles[i]], record, params);
        FinishTransfer(analysed.lab, params, record);
    }
    return STATUS_OK;
}

Status ComputeTransfersArray(const Engine* engine, const IImage* content, TRANSFER* out,
                             const VoraParameters& params) {
    if (!out) return STATUS_INVALID_ARGUMENT;
    // Refuse before sizing the working vector, so a bad call allocates nothing.
    if (!engine || !content) return STATUS_INVALID_ARGUMENT;
    if (params.numTransfers == 0) return STATUS_NO_TRANSFERS_REQUESTED;
    if (!engine->CanRankStyles()) return STATUS_MODEL_INCOMPLETE;

    std::vector<TRANSFER> records(params.numTransfers);
    // A count without an array means no faces; sizing by it would only allocate.
    const size_t faces = params.isVoraParameterHavingFaces() ? params.numFaceRects : 0;
    for (TRANSFER& record : records) record.faceCorrections.assign(faces, FaceCorrection{});

    const Status status = ComputeTransfers(engine, content, records, params);
    if (status != STATUS_OK) return status;
    for (uint64_t i = 0; i < params.numTransfers; ++i) out[i] = records.at(i);
    return status;
}

Status ComputeTransferToStyleImage(const IImage* content, const IImage* style, TRANSFER& out,
                                   const VoraParameters& params) {
    if (!content || !style) return STATUS_INVALID_ARGUMENT;
    const cv::Mat contentBgr = ToWorkingOrder(content);
    const cv::Mat styleBgr = ToWorkingOrder(style);

    cv::Mat contentLab(contentBgr.rows, contentBgr.cols, CV_32FC3);
    ConvertToLab(contentBgr, contentLab);
    cv::Mat styleLab(styleBgr.rows, styleBgr.cols, CV_32FC3);
    ConvertToLab(styleBgr, styleLab);

    ColourStats contentStats{};
    ComputeChromaStats(contentLab, contentStats);
    ComputeLightnessStats(contentLab, contentStats);
    ColourStats styleStats{};
    ComputeChromaStats(styleLab, styleStats);
    ComputeLightnessStats(styleLab, styleStats);

    out.clusterIndex = -1;
    out.styleIndex = -1;
    SolveTransfer(contentStats, styleStats, out, params);
    return STATUS_OK;
}

Status ComputeTransferToStyleIndex(const Engine* engine, const IImage* content, int styleIndex, TRANSFER& out,
                                   const VoraParameters& params) {
    if (!engine || !content) return STATUS_INVALID_ARGUMENT;
    if (styleIndex < 0 || static_cast<size_t>(styleIndex) >= engine->styleRecords.size())
        return STATUS_STYLE_INDEX_OUT_OF_RANGE;

    const AnalysedImage analysed = Analyse(content);
    out.clusterIndex = -1;
    out.styleIndex = styleIndex;
    SolveTransfer(analysed.stats, engine->styleRecords[styleIndex], out, params);
    return STATUS_OK;
}

}  // namespace vora
