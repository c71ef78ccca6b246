#pragma once

// A small writer of the network weights format (protobuf wire format of a
// NetParameter), enough for the model builder and for test fixtures.

#include <cstdint>
#include <string>
#include <vector>

namespace vora {

struct WeightsBlob {
    std::vector<int64_t> shape;
    std::vector<float> data;
};

struct WeightsLayer {
    std::string name;
    std::string type;
    std::vector<std::string> bottoms;
    std::vector<std::string> tops;
    std::vector<WeightsBlob> blobs;
};

// Serialises one BlobProto (shape and packed data), the layout of a mean file.
std::string SerializeBlob(const WeightsBlob& blob);

// Serialises a NetParameter holding the named layers and their blobs.
std::string SerializeWeights(const std::string& netName, const std::vector<WeightsLayer>& layers);

// Writes the serialised weights to path; returns false on an I/O failure.
bool WriteWeightsFile(const std::string& path, const std::string& netName,
                      const std::vector<WeightsLayer>& layers);

}  // namespace vora
