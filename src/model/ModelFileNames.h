#pragma once

// The files a model directory consists of, relative to it. The library reads
// them, the model builder writes them and the tool examines them, all by
// these names.

namespace vora {

constexpr const char* kClusterFileName = "semantic_cluster_1000.dat";
constexpr const char* kStyleFileName = "styledb_style_1500.dat";
constexpr const char* kScoresFileName = "semantic_style_scores_1000_1500_1.dat";
constexpr const char* kDistanceFileName = "styledb_fdist_1500.dat";

// The network: a folder, and two files in it.
constexpr const char* kNetworkFolder = "net/";
constexpr const char* kNetworkDefinitionName = "deploy2.prototxt";
constexpr const char* kNetworkWeightsName = "caffe_reduce_512_model";
constexpr const char* kNetworkDefinitionPath = "net/deploy2.prototxt";
constexpr const char* kNetworkWeightsPath = "net/caffe_reduce_512_model";

// All six, in the order a model is described.
constexpr const char* kModelFileNames[] = {kClusterFileName,       kStyleFileName,         kScoresFileName,
                                           kDistanceFileName,      kNetworkDefinitionPath, kNetworkWeightsPath};

}  // namespace vora
