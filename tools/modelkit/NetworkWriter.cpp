#include "modelkit/NetworkWriter.h"

#include <cstring>
#include <fstream>

namespace vora {
namespace {

// Field numbers of the weights format.
constexpr int kNetName = 1;
constexpr int kNetLayer = 100;
constexpr int kLayerName = 1;
constexpr int kLayerType = 2;
constexpr int kLayerBottom = 3;
constexpr int kLayerTop = 4;
constexpr int kLayerBlobs = 7;
constexpr int kBlobData = 5;
constexpr int kBlobShape = 7;
constexpr int kShapeDim = 1;

constexpr int kWireLengthDelimited = 2;

void PutVarint(std::string& out, uint64_t value) {
    while (value >= 0x80) {
        out.push_back(static_cast<char>((value & 0x7F) | 0x80));
        value >>= 7;
    }
    out.push_back(static_cast<char>(value));
}

void PutKey(std::string& out, int field, int wireType) {
    PutVarint(out, (static_cast<uint64_t>(field) << 3) | static_cast<uint64_t>(wireType));
}

void PutBytes(std::string& out, int field, const std::string& bytes) {
    PutKey(out, field, kWireLengthDelimited);
    PutVarint(out, bytes.size());
    out += bytes;
}

std::string SerializeLayer(const WeightsLayer& layer) {
    std::string out;
    PutBytes(out, kLayerName, layer.name);
    PutBytes(out, kLayerType, layer.type);
    for (const std::string& bottom : layer.bottoms) PutBytes(out, kLayerBottom, bottom);
    for (const std::string& top : layer.tops) PutBytes(out, kLayerTop, top);
    for (const WeightsBlob& blob : layer.blobs) PutBytes(out, kLayerBlobs, SerializeBlob(blob));
    return out;
}

}  // namespace

std::string SerializeBlob(const WeightsBlob& blob) {
    std::string shape;
    std::string dims;
    for (int64_t dim : blob.shape) PutVarint(dims, static_cast<uint64_t>(dim));
    PutBytes(shape, kShapeDim, dims);  // packed repeated int64

    std::string data(blob.data.size() * sizeof(float), '\0');
    // The format stores little-endian IEEE floats, as this machine does.
    if (!blob.data.empty()) std::memcpy(&data[0], blob.data.data(), data.size());

    std::string out;
    PutBytes(out, kBlobData, data);  // packed repeated float
    PutBytes(out, kBlobShape, shape);
    return out;
}

std::string SerializeWeights(const std::string& netName, const std::vector<WeightsLayer>& layers) {
    std::string out;
    PutBytes(out, kNetName, netName);
    for (const WeightsLayer& layer : layers) PutBytes(out, kNetLayer, SerializeLayer(layer));
    return out;
}

bool WriteWeightsFile(const std::string& path, const std::string& netName,
                      const std::vector<WeightsLayer>& layers) {
    const std::string bytes = SerializeWeights(netName, layers);
    std::ofstream file(path, std::ios::binary | std::ios::trunc);
    if (!file) return false;
    file.write(bytes.data(), static_cast<std::streamsize>(bytes.size()));
    return static_cast<bool>(file.flush());
}

}  // namespace vora
