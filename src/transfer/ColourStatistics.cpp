#include "transfer/ColourStatistics.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <utility>
#include <vector>

#include <tbb/blocked_range.h>
#include <tbb/enumerable_thread_specific.h>
#include <tbb/parallel_for.h>

#include "color/ColorConversion.h"

namespace vora {

namespace {

// The lightness values the conversion can give, one per labTable entry, and
// a hash from their bits to their entry. An image converted by ConvertToLab
// holds at most kTableSize distinct lightness values, so its sorted
// lightness is a run of each, read from a histogram without sorting.
class LightnessLevels {
public:
    LightnessLevels() {
        m_slots.fill(kEmpty);
        for (size_t i = 0; i < kTableSize; ++i) {
            // The expression of RgbToLab, so the bits are the same.
            const float value = static_cast<float>((static_cast<double>(labTable[i]) * 116.0 - 16.0) / 100.0);
            const uint32_t bits = Bits(value);
            size_t slot = Hash(bits);
            while (m_slots[slot] != kEmpty && m_keys[slot] != bits) slot = (slot + 1) & (kSlots - 1);
            if (m_slots[slot] == kEmpty) {
                m_slots[slot] = static_cast<uint16_t>(m_values.size());
                m_keys[slot] = bits;
                m_values.push_back(value);
            }
        }
    }

    // The level of a value, or -1 when no conversion gives it.
    int Find(float value) const {
        const uint32_t bits = Bits(value);
        for (size_t slot = Hash(bits);; slot = (slot + 1) & (kSlots - 1)) {
            if (m_slots[slot] == kEmpty) return -1;
            if (m_keys[slot] == bits) return m_slots[slot];
        }
    }
    size_t Count() const { return m_values.size(); }
    float Value(size_t level) const { return m_values[level]; }

private:
    static constexpr size_t kSlots = 8192;  // more than twice kTableSize: short probes
    static constexpr uint16_t kEmpty = 0xFFFF;
    static uint32_t Bits(float value) {
        uint32_t bits;
        std::memcpy(&bits, &value, sizeof bits);
        return bits;
    }
    static size_t Hash(uint32_t bits) { return (bits * 0x9E3779B1u) >> (32 - 13); }

    std::array<uint16_t, kSlots> m_slots;
    std::array<uint32_t, kSlots> m_keys{};
    std::vector<float> m_values;
};

const LightnessLevels& Levels() {
    static const LightnessLevels levels;
    return levels;
}

// Counts per level of the image's lightness; false (counts unspecified) when
// a value is not one the conversion gives.
bool CountLevels(const cv::Mat& lab, std::vector<int64_t>& counts) {
    const LightnessLevels& levels = Levels();
    counts.assign(levels.Count(), 0);
    for (int row = 0; row < lab.rows; ++row) {
        const float* pixel = lab.ptr<float>(row);
        for (int c = 0; c < lab.cols; ++c, pixel += 3) {
            const int level = levels.Find(pixel[0]);
            if (level < 0) return false;
            ++counts[level];
        }
    }
    return true;
}

// The same statistics as the sort below, from counts: the sorted array is a
// run of each distinct value, so every read of s[k] is the value whose run
// holds rank k, and normalising is monotone, so it commutes with the ranks.
void LightnessStatsFromCounts(const std::vector<int64_t>& counts, ColourStats& stats) {
    const LightnessLevels& levels = Levels();
    std::vector<std::pair<float, int64_t>> runs;
    for (size_t level = 0; level < counts.size(); ++level)
        if (counts[level] > 0) runs.emplace_back(levels.Value(level), counts[level]);
    std::sort(runs.begin(), runs.end());
    std::vector<int64_t> ends(runs.size());  // one past the last rank of each run
    int64_t total = 0;
    for (size_t i = 0; i < runs.size(); ++i) ends[i] = total += runs[i].second;
    const auto valueAt = [&](int64_t rank) {
        return runs[std::upper_bound(ends.begin(), ends.end(), rank) - ends.begin()].first;
    };

    const size_t n = static_cast<size_t>(total);
    const size_t low = static_cast<size_t>(static_cast<double>(n - 1) * 0.005 + 0.5);
    const size_t high = static_cast<size_t>(static_cast<double>(n - 1) * 0.995 + 0.5);
    stats.lightnessLow = valueAt(static_cast<int64_t>(low));
    stats.lightnessHigh = valueAt(static_cast<int64_t>(high));

    const float pointLow = stats.lightnessLow;
    const double spread = static_cast<double>(stats.lightnessHigh - pointLow);
    const auto normalise = [&](float v) {
        const double q = static_cast<double>(v - pointLow) / spread;
        return static_cast<float>(std::min(1.0, std::max(0.0, q)));
    };
    int64_t zeros = 0;
    int64_t notOnes = 0;
    for (const auto& [value, count] : runs) {
        const float q = normalise(value);
        if (q == 0.0f) zeros += count;
        if (q != 1.0f) notOnes += count;
    }
    const double interior = static_cast<double>(static_cast<int>(notOnes) - static_cast<int>(zeros) - 1);
    for (int i = 0; i < 32; ++i) {
        int64_t index = static_cast<int64_t>(static_cast<int>(zeros)) + static_cast<int>(std::ceil(i / 31.0 * interior));
        index = std::min<int64_t>(std::max<int64_t>(index, 0), total - 1);
        stats.lightness[i] = normalise(valueAt(index));
    }
}

// A direct-mapped cache of the conversion, per thread: 2^bits entries of a
// tagged 24-bit colour and its three floats (16 bytes). A photo has far
// fewer colours than pixels.
class LabCache {
public:
    explicit LabCache(unsigned bits) : m_shift(32 - bits), m_entries(size_t{1} << bits) {}

    const float* Get(uint8_t red, uint8_t green, uint8_t blue) {
        const uint32_t colour = static_cast<uint32_t>(red) << 16 | static_cast<uint32_t>(green) << 8 | blue;
        Entry& entry = m_entries[(colour * 0x9E3779B1u) >> m_shift];
        const uint32_t tag = colour | 0x80000000u;  // never 0, the empty entry
        if (entry.tag != tag) {
            const LabPixel pixel = RgbToLab(red, green, blue);
            entry = Entry{tag, {pixel.lightness01, pixel.a, pixel.b}};
        }
        return entry.lab;
    }

private:
    struct Entry {
        uint32_t tag = 0;
        float lab[3] = {};
    };
    unsigned m_shift;
    std::vector<Entry> m_entries;
};

// Cache size by the work, as apply sizes its cache: none for small images,
// at most 2^18 entries (4 MiB a thread).
unsigned LabCacheBits(size_t pixels) {
    if (pixels < (size_t{1} << 15)) return 0;
    unsigned bits = 10;
    while (bits < 18 && (size_t{16} << bits) < pixels) ++bits;
    return bits;
}

}  // namespace

void ConvertToLab(const cv::Mat& bgr8, cv::Mat& lab) {
    if (bgr8.rows < 1) return;
    CV_Assert(bgr8.type() == CV_8UC3 && lab.type() == CV_32FC3 && lab.size() == bgr8.size());

    const int columns = bgr8.cols;
    const unsigned bits = LabCacheBits(static_cast<size_t>(bgr8.rows) * static_cast<size_t>(columns));
    tbb::enumerable_thread_specific<LabCache> caches([bits] { return LabCache(bits > 0 ? bits : 1); });
    // Each pixel on its own: rows in parallel, and a cached pixel, give the same bits.
    tbb::parallel_for(tbb::blocked_range<int>(0, bgr8.rows, 16), [&](const tbb::blocked_range<int>& rows) {
        LabCache* cache = bits > 0 ? &caches.local() : nullptr;
        for (int row = rows.begin(); row < rows.end(); ++row) {
            const uint8_t* in = bgr8.ptr<uint8_t>(row);
            float* out = lab.ptr<float>(row);
            for (int c = 0; c < columns; ++c, in += 3, out += 3) {
                // Bytes are B, G, R; the conversion takes R, G, B.
                if (cache != nullptr) {
                    const float* cached = cache->Get(in[2], in[1], in[0]);
                    out[0] = cached[0];
                    out[1] = cached[1];
                    out[2] = cached[2];
                    continue;
                }
                const LabPixel pixel = RgbToLab(in[2], in[1], in[0]);
                out[0] = pixel.lightness01;
                out[1] = pixel.a;
                out[2] = pixel.b;
            }
        }
    });
}

int ComputeChromaStats(const cv::Mat& lab, ColourStats& stats) {
    const int pixels = lab.rows * lab.cols;
    const cv::Mat chroma = lab.reshape(1, pixels).colRange(1, 3);

    cv::Mat covariance;
    cv::Mat mean;
    cv::calcCovarMatrix(chroma, covariance, mean, cv::COVAR_NORMAL | cv::COVAR_SCALE | cv::COVAR_ROWS, CV_32F);
    stats.chromaMean[0] = mean.at<float>(0, 0);
    stats.chromaMean[1] = mean.at<float>(0, 1);

    cv::Mat root;
    MatrixSqrt(covariance, root);
    for (int i = 0; i < 4; ++i) stats.chromaSqrtCov[i] = root.at<float>(i / 2, i % 2);
    return 0;
}

bool ComputeLightnessStatsFromLevels(const cv::Mat& lab, ColourStats& stats) {
    std::vector<int64_t> counts;
    if (lab.empty() || !CountLevels(lab, counts)) return false;
    LightnessStatsFromCounts(counts, stats);
    return true;
}

int ComputeLightnessStats(const cv::Mat& lab, ColourStats& stats) {
    if (ComputeLightnessStatsFromLevels(lab, stats)) return 0;
    return ComputeLightnessStatsBySort(lab, stats);
}

int ComputeLightnessStatsBySort(const cv::Mat& lab, ColourStats& stats) {
    const int pixels = lab.rows * lab.cols;
    const cv::Mat lightness = lab.reshape(1, pixels).col(0);

    cv::Mat sorted;
    cv::sort(lightness, sorted, cv::SORT_EVERY_COLUMN | cv::SORT_ASCENDING);
    float* s = sorted.ptr<float>();
    const size_t n = static_cast<size_t>(pixels);

    const size_t low = static_cast<size_t>(static_cast<double>(n - 1) * 0.005 + 0.5);
    const size_t high = static_cast<size_t>(static_cast<double>(n - 1) * 0.995 + 0.5);
    stats.lightnessLow = s[low];
    stats.lightnessHigh = s[high];

    // The difference is taken in float and only then widened: a flat image
    // gives 0/0 here, which the clamp turns into 0 (std::max keeps its first
    // argument when the comparison with NaN fails).
    const float pointLow = stats.lightnessLow;
    const double spread = static_cast<double>(stats.lightnessHigh - pointLow);
    for (size_t i = 0; i < n; ++i) {
        const double q = static_cast<double>(s[i] - pointLow) / spread;
        s[i] = static_cast<float>(std::min(1.0, std::max(0.0, q)));
    }

    const int zeros = pixels - cv::countNonZero(sorted);
    const int notOnes = cv::countNonZero(1.0 - sorted);
    // One less than the number of values strictly inside (0, 1).
    const double interior = static_cast<double>(notOnes - zeros - 1);

    for (int i = 0; i < 32; ++i) {
        int64_t index = static_cast<int64_t>(zeros) + static_cast<int>(std::ceil(i / 31.0 * interior));
        // When every value is 0 (a flat image, or one pixel) Z = N and M = -1,
        // so i = 0 would read s[N]. Out-of-range indices are clamped into the
        // array: such an image then samples its (all-equal) end values.
        index = std::min<int64_t>(std::max<int64_t>(index, 0), static_cast<int64_t>(n) - 1);
        stats.lightness[i] = s[index];
    }
    return 0;
}

void MatrixSqrt(const cv::Mat& input, cv::Mat& output) {
    const cv::SVD svd(input, 0);
    cv::Mat rootW;
    cv::sqrt(svd.w, rootW);
    const cv::Mat root = svd.u * cv::Mat::diag(rootW) * svd.vt;
    root.copyTo(output);
}

}  // namespace vora
