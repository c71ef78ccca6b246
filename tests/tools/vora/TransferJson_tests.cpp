// The transfers file: exact round trips and named errors.

#include <cmath>
#include <cstdint>
#include <cstring>
#include <functional>
#include <random>
#include <string>
#include <utility>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <nlohmann/json.hpp>

#include "tools/vora/CliSupport.h"
#include "vora/Cli.h"
#include "vora/TransferJson.h"

namespace {

using namespace vora::clitest;

TEST(TransferJson, RoundTripIsBitExactForEveryKindOfFloat) {
    auto fromBits = [](uint32_t bits) { float f; std::memcpy(&f, &bits, 4); return f; };
    // Specials first: NaNs with sign and payload, infinities, signed zeros,
    // the smallest subnormal, the largest float, a value with no short decimal;
    // then random bit patterns.
    const std::vector<float> specials = {fromBits(0x7fc00000), fromBits(0xffc00001), fromBits(0x7f800001),
                                         INFINITY, -INFINITY, 0.0f, -0.0f, fromBits(1), -fromBits(0x7f7fffff),
                                         0.1f, 1.0f / 3.0f};
    std::mt19937 random(3);
    size_t next = 0;
    auto anyFloat = [&]() { return next < specials.size() ? specials[next++] : fromBits(uint32_t(random())); };
    vora::cli::TransferDocument document;
    for (int r = 0; r < 4; ++r) {
        vora::TRANSFER t;
        t.clusterIndex = r - 1;
        t.styleIndex = 1000 * r - 1;
        float* fields[] = {t.contentMean, t.styleMean, t.chromaMatrix, t.toneCurve, &t.lightnessLow, &t.lightnessHigh};
        const size_t sizes[] = {2, 2, 4, 257, 1, 1};
        for (size_t f = 0; f < 6; ++f) std::generate(fields[f], fields[f] + sizes[f], anyFloat);
        for (int k = 0; k < r; ++k)
            t.faceCorrections.push_back({anyFloat(), anyFloat(), anyFloat(), anyFloat(), anyFloat(), anyFloat(),
                                         anyFloat(), anyFloat()});
        document.transfers.push_back(t);
    }
    document.faces.push_back({0.1, 0.30000000000000004, 1.0 / 3.0, 0.9});
    document.rankingFactor = 0.7f;

    const std::string text = vora::cli::SerializeTransfers(document);
    const vora::cli::TransferDocument back = vora::cli::ParseTransfers(text, "mem.json");
    EXPECT_TRUE(std::equal(back.transfers.begin(), back.transfers.end(), document.transfers.begin(),
                           document.transfers.end(), SameRecord));
    EXPECT_TRUE(back.faces[0].right == 0.30000000000000004 && back.faces[0].top == 1.0 / 3.0);
    EXPECT_EQ(back.rankingFactor, 0.7f);
    EXPECT_EQ(vora::cli::SerializeTransfers(back), text);
}

TEST(TransferJson, MalformedRecordsAreNamed) {
    vora::cli::TransferDocument document;
    document.transfers.resize(2);
    const std::string good = vora::cli::SerializeTransfers(document);
    using json = nlohmann::json;
    using Break = std::pair<std::function<void(json&)>, std::string>;  // change, what the message names
    for (const auto& [change, mentions] : std::vector<Break>{
             {[](json& j) { j["transfers"][0]["toneCurve"].erase(0); },
              "transfers[0].toneCurve: expected an array of 257 numbers"},
             {[](json& j) { j["transfers"][1]["lightnessLow"] = "low"; }, "transfers[1].lightnessLow"},
             {[](json& j) { j["transfers"][1]["faceCorrections"] = json::array({json::object()}); },
              "transfers[1].faceCorrections[0]: missing field \"centreX\""},
             {[](json& j) { j["transfers"][1]["lightnessHigh"] = 1e39; }, "32-bit float"},
             {[](json& j) { j = json::array({1, 2}); }, "not a transfers file"},
             // Read as signed, this wrapped to -1.
             {[](json& j) { j["transfers"][0]["clusterIndex"] = 18446744073709551615ull; },
              "transfers[0].clusterIndex: number out of the 32-bit range"},
             // 20,000 corrections made apply on 512 x 512 take a minute.
             {[](json& j) {
                  vora::cli::TransferDocument crowded;
                  crowded.transfers.resize(1);
                  crowded.transfers[0].faceCorrections.resize(257);
                  j = json::parse(vora::cli::SerializeTransfers(crowded));
              },
              "transfers[0].faceCorrections: holds 257 face corrections; at most 256 are accepted"}}) {
        json text = json::parse(good);
        change(text);
        EXPECT_THAT([&] { vora::cli::ParseTransfers(text.dump(), "t.json"); },
                    testing::ThrowsMessage<vora::cli::Failure>(testing::HasSubstr(mentions)));
    }
    // A number beyond a double escaped the parser as its own exception, naming no file.
    std::string huge = good;
    const size_t at = huge.find("\"lightnessLow\": ") + 16;
    huge.replace(at, huge.find_first_of(",\n", at) - at, "1e400");
    EXPECT_THAT([&] { vora::cli::ParseTransfers(huge, "t.json"); },
                testing::ThrowsMessage<vora::cli::Failure>(testing::HasSubstr("beyond the range of a double")));
}

}  // namespace
