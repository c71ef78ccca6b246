#include "api/ComputeDriver.h"

#include <algorithm>
#include <array>
#include <cassert>
#include <cmath>
#include <cstdint>

#include <opencv2/core.hpp>
#include <tbb/parallel_invoke.h>

#include "color/WorkingOrder.h"
#include "model/Engine.h"
#include "semantic/NetworkInput.h"
#include "semantic/StyleRanking.h"
#include "transfer/ColourStatistics.h"
#include "transfer/FinishTransfer.h"
#include "transfer/SolveTransfer.h"

namespace vora {

namespace {

// The working Lab of one region of an R, G, B image, for the face samples:
// the whole image is never converted.
cv::Mat LabOfRegion(const cv::Mat& rgb8, const cv::Rect& region) {
    const cv::Mat pixels = rgb8(region);
    cv::Mat lab(pixels.rows, pixels.cols, CV_32FC3);
    ConvertToLab(pixels, lab, ChannelOrder::Rgb);
    return lab;
}

ColourStats Summarise(const IImage* image) {
    ColourStats stats{};
    SummariseColours(RgbView(image), ChannelOrder::Rgb, stats);
    return stats;
}

}  // namespace

Status ComputeTransfers(const Engine& engine, const IImage& content, std::vector<TRANSFER>& out,
                        const VoraParameters& params) {
    assert(params.numTransfers >= 1 && out.size() >= params.numTransfers && engine.CanRankStyles());
    // The statistics and the network read the caller's pixels as they stand,
    // side by side: neither keeps a copy of the image.
    const cv::Mat rgb8 = RgbView(&content);
    ColourStats stats{};
    std::array<float, 512> feature{};
    bool extracted = false;
    tbb::parallel_invoke([&] { SummariseColours(rgb8, ChannelOrder::Rgb, stats); },
                         [&] { extracted = ExtractFeature(*engine.network, rgb8, feature.data(), ChannelOrder::Rgb); });
    if (!extracted) return STATUS_MODEL_INCOMPLETE;

    std::vector<int32_t> clusterOrder(engine.clusterCentres.size(), 0);
    OrderClusters(engine, feature.data(), clusterOrder);

    std::vector<int32_t> chosenClusters;
    std::vector<int32_t> chosenStyles;
    const Status selected =
        SelectStyles(engine, stats, clusterOrder, chosenClusters, chosenStyles, params);
    if (selected != STATUS_OK) return selected;

    // Solved into copies, so a refused call leaves the caller's records as they were.
    std::vector<TRANSFER> solved(out.begin(), out.begin() + params.numTransfers);
    for (uint32_t i = 0; i < params.numTransfers; ++i) {
        TRANSFER& record = solved[i];
        record.clusterIndex = chosenClusters[i];
        record.styleIndex = chosenStyles[i];
        SolveTransfer(stats, engine.styleRecords[chosenStyles[i]], record, params);
        FinishTransfer(
            rgb8.size(), [&rgb8](const cv::Rect& region) { return LabOfRegion(rgb8, region); }, params, record);
        if (!TransferIsFinite(record)) return STATUS_NON_FINITE_RESULT;
    }
    std::move(solved.begin(), solved.end(), out.begin());
    return STATUS_OK;
}

Status ComputeTransferToStyleImage(const IImage& content, const IImage& style, TRANSFER& out,
                                   const VoraParameters& params) {
    ColourStats contentStats{};
    ColourStats styleStats{};
    SummariseColourPair(RgbView(&content), RgbView(&style), ChannelOrder::Rgb, contentStats, styleStats);

    TRANSFER solved = out;
    solved.clusterIndex = -1;
    solved.styleIndex = -1;
    SolveTransfer(contentStats, styleStats, solved, params);
    if (!TransferIsFinite(solved)) return STATUS_NON_FINITE_RESULT;
    out = std::move(solved);
    return STATUS_OK;
}

Status ComputeTransferToStyleIndex(const Engine& engine, const IImage& content, size_t styleIndex, TRANSFER& out,
                                   const VoraParameters& params) {
    assert(styleIndex < engine.styleRecords.size());

    const ColourStats stats = Summarise(&content);
    TRANSFER solved = out;
    solved.clusterIndex = -1;
    solved.styleIndex = static_cast<int>(styleIndex);
    SolveTransfer(stats, engine.styleRecords[styleIndex], solved, params);
    if (!TransferIsFinite(solved)) return STATUS_NON_FINITE_RESULT;
    out = std::move(solved);
    return STATUS_OK;
}

}  // namespace vora
