#include "vora/TransferJson.h"

#include <cinttypes>
#include <cmath>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <limits>
#include <fstream>
#include <sstream>

#include <nlohmann/json.hpp>

#include "transfer/FinishTransfer.h"
#include "vora/Cli.h"

namespace vora {
namespace cli {
namespace {

// Ordered, so that a file reads top-down: format and version first, records last.
using Json = nlohmann::ordered_json;

uint32_t FloatBits(float value) {
    uint32_t bits;
    std::memcpy(&bits, &value, sizeof bits);
    return bits;
}

float FloatFromBits(uint32_t bits) {
    float value;
    std::memcpy(&value, &bits, sizeof value);
    return value;
}

// A finite float becomes the JSON number of its exact double value: the
// writer prints doubles so that they parse back to the same double, and that
// double converts back to the same float. Non-finite values are not JSON
// numbers, so they become strings; a NaN keeps its sign and payload.
Json EncodeFloat(float value) {
    if (std::isfinite(value)) return Json(static_cast<double>(value));
    if (std::isinf(value)) return Json(value > 0 ? "inf" : "-inf");
    char text[32];
    std::snprintf(text, sizeof text, "nan:0x%08" PRIx32, FloatBits(value));
    return Json(text);
}

class Reader {
public:
    explicit Reader(std::string sourceName) : m_source(std::move(sourceName)) {}

    [[noreturn]] void Fail(const std::string& where, const std::string& what) const {
        throw Failure(m_source, (where.empty() ? "" : where + ": ") + what);
    }

    const Json& Field(const Json& object, const char* name, const std::string& where) const {
        auto it = object.find(name);
        if (it == object.end()) Fail(where, std::string("missing field \"") + name + "\"");
        return *it;
    }

    float Float(const Json& value, const std::string& where) const {
        if (value.is_number()) {
            // Any number is accepted; one written by this tool is exactly a
            // float and converts without rounding.
            const double d = value.get<double>();
            if (!std::isfinite(d) || std::fabs(d) > std::numeric_limits<float>::max())
                Fail(where, "number out of the range of a 32-bit float");
            return static_cast<float>(d);
        }
        if (value.is_string()) {
            const std::string text = value.get<std::string>();
            if (text == "inf") return INFINITY;
            if (text == "-inf") return -INFINITY;
            if (text == "nan") return NAN;
            unsigned int bits = 0;
            char trailing = 0;
            if (text.size() == 14 && std::sscanf(text.c_str(), "nan:0x%8x%c", &bits, &trailing) == 1) {
                const float f = FloatFromBits(bits);
                if (std::isnan(f)) return f;
            }
        }
        Fail(where, "expected a number, \"inf\", \"-inf\" or \"nan:0xXXXXXXXX\"");
    }

    void Floats(const Json& value, float* out, size_t count, const std::string& where) const {
        if (!value.is_array() || value.size() != count)
            Fail(where, "expected an array of " + std::to_string(count) + " numbers");
        for (size_t i = 0; i < count; ++i) out[i] = Float(value[i], where + "[" + std::to_string(i) + "]");
    }

    double Double(const Json& value, const std::string& where) const {
        if (!value.is_number()) Fail(where, "expected a number");
        return value.get<double>();
    }

    int32_t Int32(const Json& value, const std::string& where) const {
        if (!value.is_number_integer()) Fail(where, "expected a whole number");
        // Read as signed, an unsigned number above 2^63 would wrap to a small one.
        if (value.is_number_unsigned() && value.get<uint64_t>() > static_cast<uint64_t>(INT32_MAX))
            Fail(where, "number out of the 32-bit range");
        const int64_t v = value.get<int64_t>();
        if (v < INT32_MIN || v > INT32_MAX) Fail(where, "number out of the 32-bit range");
        return static_cast<int32_t>(v);
    }

    uint64_t UInt64(const Json& value, const std::string& where) const {
        if (!value.is_number_unsigned()) Fail(where, "expected a whole number, not negative");
        return value.get<uint64_t>();
    }

    std::string String(const Json& value, const std::string& where) const {
        if (!value.is_string()) Fail(where, "expected a string");
        return value.get<std::string>();
    }

private:
    std::string m_source;
};

Json EncodeTransfer(const TRANSFER& t) {
    Json j = Json::object();
    j["clusterIndex"] = t.clusterIndex;
    j["styleIndex"] = t.styleIndex;
    auto floats = [](const float* values, size_t count) {
        Json a = Json::array();
        for (size_t i = 0; i < count; ++i) a.push_back(EncodeFloat(values[i]));
        return a;
    };
    j["contentMean"] = floats(t.contentMean, 2);
    j["styleMean"] = floats(t.styleMean, 2);
    j["chromaMatrix"] = floats(t.chromaMatrix, 4);
    j["toneCurve"] = floats(t.toneCurve, 257);
    j["lightnessLow"] = EncodeFloat(t.lightnessLow);
    j["lightnessHigh"] = EncodeFloat(t.lightnessHigh);
    Json faces = Json::array();
    for (const FaceCorrection& f : t.faceCorrections) {
        Json face = Json::object();
        face["centreX"] = EncodeFloat(f.centreX);
        face["centreY"] = EncodeFloat(f.centreY);
        face["halfSizeX"] = EncodeFloat(f.halfSizeX);
        face["halfSizeY"] = EncodeFloat(f.halfSizeY);
        face["measuredL"] = EncodeFloat(f.measuredL);
        face["measuredA"] = EncodeFloat(f.measuredA);
        face["measuredB"] = EncodeFloat(f.measuredB);
        face["exponent"] = EncodeFloat(f.exponent);
        faces.push_back(face);
    }
    j["faceCorrections"] = faces;
    return j;
}

TRANSFER DecodeTransfer(const Reader& r, const Json& j, const std::string& where) {
    if (!j.is_object()) r.Fail(where, "expected an object");
    TRANSFER t;
    t.clusterIndex = r.Int32(r.Field(j, "clusterIndex", where), where + ".clusterIndex");
    t.styleIndex = r.Int32(r.Field(j, "styleIndex", where), where + ".styleIndex");
    r.Floats(r.Field(j, "contentMean", where), t.contentMean, 2, where + ".contentMean");
    r.Floats(r.Field(j, "styleMean", where), t.styleMean, 2, where + ".styleMean");
    r.Floats(r.Field(j, "chromaMatrix", where), t.chromaMatrix, 4, where + ".chromaMatrix");
    r.Floats(r.Field(j, "toneCurve", where), t.toneCurve, 257, where + ".toneCurve");
    t.lightnessLow = r.Float(r.Field(j, "lightnessLow", where), where + ".lightnessLow");
    t.lightnessHigh = r.Float(r.Field(j, "lightnessHigh", where), where + ".lightnessHigh");
    const Json& faces = r.Field(j, "faceCorrections", where);
    if (!faces.is_array()) r.Fail(where + ".faceCorrections", "expected an array");
    // Apply visits, at every pixel, the faces whose boxes meet its row: a
    // hostile count would cost minutes.
    if (faces.size() > kMaxFaceCorrections)
        r.Fail(where + ".faceCorrections", "holds " + std::to_string(faces.size()) + " face corrections; at most " +
                                               std::to_string(kMaxFaceCorrections) + " are accepted");
    for (size_t i = 0; i < faces.size(); ++i) {
        const std::string at = where + ".faceCorrections[" + std::to_string(i) + "]";
        const Json& face = faces[i];
        if (!face.is_object()) r.Fail(at, "expected an object");
        FaceCorrection f{};
        f.centreX = r.Float(r.Field(face, "centreX", at), at + ".centreX");
        f.centreY = r.Float(r.Field(face, "centreY", at), at + ".centreY");
        f.halfSizeX = r.Float(r.Field(face, "halfSizeX", at), at + ".halfSizeX");
        f.halfSizeY = r.Float(r.Field(face, "halfSizeY", at), at + ".halfSizeY");
        f.measuredL = r.Float(r.Field(face, "measuredL", at), at + ".measuredL");
        f.measuredA = r.Float(r.Field(face, "measuredA", at), at + ".measuredA");
        f.measuredB = r.Float(r.Field(face, "measuredB", at), at + ".measuredB");
        f.exponent = r.Float(r.Field(face, "exponent", at), at + ".exponent");
        t.faceCorrections.push_back(f);
    }
    return t;
}

}  // namespace

std::string FloatToJsonText(float value) { return EncodeFloat(value).dump(); }

std::string SerializeTransfers(const TransferDocument& d) {
    Json j = Json::object();
    j["format"] = kTransferFormatName;
    j["version"] = kTransferFormatVersion;
    j["tool"] = d.tool;
    j["model"] = d.model;
    j["photo"] = {{"file", d.photo}, {"width", d.photoWidth}, {"height", d.photoHeight}};
    if (!d.style.empty()) j["style"] = d.style;
    j["parameters"] = {{"numTransfers", d.numTransfers},
                       {"rankingFactor", EncodeFloat(d.rankingFactor)},
                       {"solveFactor", EncodeFloat(d.solveFactor)},
                       {"limitFactor", EncodeFloat(d.limitFactor)},
                       {"finishFactor", EncodeFloat(d.finishFactor)}};
    Json faces = Json::array();
    for (const CFaceRect& f : d.faces)
        faces.push_back({{"left", f.left}, {"right", f.right}, {"top", f.top}, {"bottom", f.bottom}});
    j["faces"] = {{"source", d.faceSource}, {"rects", faces}};
    Json transfers = Json::array();
    for (const TRANSFER& t : d.transfers) transfers.push_back(EncodeTransfer(t));
    j["transfers"] = transfers;
    return j.dump(1) + "\n";
}

TransferDocument ParseTransfers(const std::string& text, const std::string& sourceName) {
    Json j;
    try {
        j = Json::parse(text);
    } catch (const Json::parse_error& e) {
        throw Failure(sourceName, "not a valid JSON document (at byte " + std::to_string(e.byte) + ")");
    } catch (const Json::out_of_range&) {
        // A number such as 1e400 overflows a double while parsing.
        throw Failure(sourceName, "not a valid JSON document (a number beyond the range of a double)");
    } catch (const Json::exception&) {
        throw Failure(sourceName, "not a valid JSON document");
    }
    Reader r(sourceName);
    if (!j.is_object()) r.Fail("", "not a transfers file (the document is not a JSON object)");
    auto format = j.find("format");
    if (format == j.end() || !format->is_string() || format->get<std::string>() != kTransferFormatName)
        r.Fail("", std::string("not a transfers file (no \"format\": \"") + kTransferFormatName + "\")");
    const Json& version = r.Field(j, "version", "");
    if (!version.is_number_integer()) r.Fail("version", "expected a whole number");
    if (version.get<int64_t>() != kTransferFormatVersion)
        r.Fail("", "format version " + version.dump() + " is not supported (this vora reads version " +
                       std::to_string(kTransferFormatVersion) + ")");

    TransferDocument d;
    if (j.contains("tool")) d.tool = r.String(j["tool"], "tool");
    if (j.contains("model")) d.model = r.String(j["model"], "model");
    if (j.contains("style")) d.style = r.String(j["style"], "style");
    if (j.contains("photo")) {
        const Json& photo = j["photo"];
        if (!photo.is_object()) r.Fail("photo", "expected an object");
        if (photo.contains("file")) d.photo = r.String(photo["file"], "photo.file");
        if (photo.contains("width")) d.photoWidth = r.UInt64(photo["width"], "photo.width");
        if (photo.contains("height")) d.photoHeight = r.UInt64(photo["height"], "photo.height");
    }
    if (j.contains("parameters")) {
        const Json& p = j["parameters"];
        if (!p.is_object()) r.Fail("parameters", "expected an object");
        d.numTransfers = r.UInt64(r.Field(p, "numTransfers", "parameters"), "parameters.numTransfers");
        d.rankingFactor = r.Float(r.Field(p, "rankingFactor", "parameters"), "parameters.rankingFactor");
        d.solveFactor = r.Float(r.Field(p, "solveFactor", "parameters"), "parameters.solveFactor");
        d.limitFactor = r.Float(r.Field(p, "limitFactor", "parameters"), "parameters.limitFactor");
        d.finishFactor = r.Float(r.Field(p, "finishFactor", "parameters"), "parameters.finishFactor");
    }
    if (j.contains("faces")) {
        const Json& faces = j["faces"];
        if (!faces.is_object()) r.Fail("faces", "expected an object");
        if (faces.contains("source")) d.faceSource = r.String(faces["source"], "faces.source");
        const Json& rects = r.Field(faces, "rects", "faces");
        if (!rects.is_array()) r.Fail("faces.rects", "expected an array");
        if (rects.size() > kMaxFaceCorrections)
            r.Fail("faces.rects", "holds " + std::to_string(rects.size()) + " faces; at most " +
                                      std::to_string(kMaxFaceCorrections) + " are accepted");
        for (size_t i = 0; i < rects.size(); ++i) {
            const std::string at = "faces.rects[" + std::to_string(i) + "]";
            if (!rects[i].is_object()) r.Fail(at, "expected an object");
            // One statement a side, so that the first bad side is the one named.
            const double left = r.Double(r.Field(rects[i], "left", at), at + ".left");
            const double right = r.Double(r.Field(rects[i], "right", at), at + ".right");
            const double top = r.Double(r.Field(rects[i], "top", at), at + ".top");
            const double bottom = r.Double(r.Field(rects[i], "bottom", at), at + ".bottom");
            d.faces.emplace_back(left, right, top, bottom);
        }
    }
    const Json& transfers = r.Field(j, "transfers", "");
    if (!transfers.is_array()) r.Fail("transfers", "expected an array");
    for (size_t i = 0; i < transfers.size(); ++i)
        d.transfers.push_back(DecodeTransfer(r, transfers[i], "transfers[" + std::to_string(i) + "]"));
    return d;
}

TransferDocument ReadTransfersFile(const std::string& path) {
    std::error_code error;
    if (!std::filesystem::exists(path, error)) throw Failure(path, "no such file");
    if (std::filesystem::is_directory(path, error)) throw Failure(path, "is a directory, not a transfers file");
    std::ifstream in(path, std::ios::binary);
    if (!in) throw Failure(path, "cannot open file");
    std::ostringstream buffer;
    buffer << in.rdbuf();
    if (in.bad()) throw Failure(path, "cannot read file");
    return ParseTransfers(buffer.str(), path);
}

TransferReference ParseTransferReference(const std::string& argument) {
    TransferReference ref;
    ref.path = argument;
    std::error_code error;
    if (std::filesystem::exists(argument, error)) return ref;
    const size_t colon = argument.rfind(':');
    if (colon == std::string::npos || colon == 0) return ref;
    const std::string path = argument.substr(0, colon);
    const std::string digits = argument.substr(colon + 1);
    if (digits.empty() || digits.find_first_not_of("0123456789") != std::string::npos) {
        // "file.json:x" or "file.json:-1" where file.json exists: a bad index,
        // not a file name (the whole argument names no file either).
        if (std::filesystem::exists(path, error))
            throw UsageError(argument + ": record index '" + digits + "' is not a whole number");
        return ref;
    }
    ref.path = path;
    ref.index = ParseInteger(digits, argument + ": record index", 0, INT32_MAX);
    ref.indexGiven = true;
    return ref;
}

TRANSFER LoadTransferRecord(const TransferReference& reference, TransferDocument* documentOut) {
    TransferDocument document = ReadTransfersFile(reference.path);
    if (document.transfers.empty()) throw Failure(reference.path, "holds no transfers");
    if (reference.index < 0 || static_cast<size_t>(reference.index) >= document.transfers.size())
        throw UsageError(reference.path + ": no record " + std::to_string(reference.index) + " (the file holds " +
                         std::to_string(document.transfers.size()) + ", numbered 0 to " +
                         std::to_string(document.transfers.size() - 1) + ")");
    TRANSFER record = document.transfers[static_cast<size_t>(reference.index)];
    if (documentOut) *documentOut = std::move(document);
    return record;
}

void CheckRenderable(const TRANSFER& t, const std::string& where) {
    if (!TransferIsFinite(t))
        throw Failure(where, "the transfer holds values that are not finite numbers; it cannot be rendered");
}

}  // namespace cli
}  // namespace vora
