#include "transfer/ColourStatistics.h"

#include <algorithm>
#include <array>
#include <atomic>
#include <cmath>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <cstdlib>
#include <mutex>
#include <new>
#include <utility>
#include <vector>

#if defined(__linux__)
#include <sys/mman.h>
#endif

#include <tbb/blocked_range.h>
#include <tbb/enumerable_thread_specific.h>
#include <tbb/parallel_for.h>
#include <tbb/parallel_pipeline.h>
#include <tbb/task_arena.h>

#include "color/ColorConversion.h"
#include "color/LabByTables.h"

namespace vora {

namespace {

// The lightness values the conversion can give, one per labTable entry, and
// a hash from their bits to their entry. An image converted by ConvertToLab
// holds at most kTableSize distinct lightness values, so its sorted
// lightness is a run of each, read from a histogram without sorting.
class LightnessLevels {
public:
    LightnessLevels() : m_levelOfEntry(kTableSize) {
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
            m_levelOfEntry[i] = m_slots[slot];
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
    // The level of the value labTable[entry] gives.
    size_t LevelOfEntry(size_t entry) const { return m_levelOfEntry[entry]; }
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
    std::vector<uint16_t> m_levelOfEntry;
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

// Row bands of about this many pixels flow through the summary's first pass.
constexpr size_t kBandPixels = size_t{1} << 16;

// The summary's first pass: bands of rows are converted on any thread into
// the image's chroma pairs (a*, b*), and counted by lightness table entry;
// each band is then handed, in image order, to one consumer, which forms the
// sequential sums OpenCV forms (their bits are the statistics' bits) while
// later bands are still being converted. release(end) is called in image
// order before a band's pairs, which end at pair `end`, are written: the
// buffer may still hold another image's pairs that are being read.
template <class Release, class Consume>
void ConvertInBands(const cv::Mat& pixels8, ChannelOrder order, float* pairs, std::vector<int64_t>& entryCounts,
                    Release&& release, Consume&& consume) {
    const int columns = pixels8.cols;
    const int bandRows = static_cast<int>(std::max<size_t>(1, kBandPixels / static_cast<size_t>(columns)));
    const int bands = (pixels8.rows + bandRows - 1) / bandRows;
    const LabByTables& convert = LabByTables::Get();
    tbb::enumerable_thread_specific<std::vector<int64_t>> threadCounts(std::vector<int64_t>(kTableSize, 0));
    const size_t bandPixels = static_cast<size_t>(bandRows) * static_cast<size_t>(columns);
    const size_t total = pixels8.total();

    int next = 0;
    tbb::parallel_pipeline(
        static_cast<size_t>(2 * tbb::this_task_arena::max_concurrency()),
        tbb::make_filter<void, int>(tbb::filter_mode::serial_in_order,
                                    [&](tbb::flow_control& control) {
                                        if (next == bands) {
                                            control.stop();
                                            return next;
                                        }
                                        release(std::min(total, bandPixels * static_cast<size_t>(next + 1)));
                                        return next++;
                                    }) &
            tbb::make_filter<int, int>(
                tbb::filter_mode::parallel,
                [&](int band) {
                    std::vector<int64_t>& counts = threadCounts.local();
                    float* out = pairs + 2 * bandPixels * static_cast<size_t>(band);
                    const int last = std::min(pixels8.rows, (band + 1) * bandRows);
                    for (int row = band * bandRows; row < last; ++row, out += 2 * static_cast<size_t>(columns))
                        convert.ChromaOfPixels(pixels8.ptr<uint8_t>(row), static_cast<size_t>(columns), order, out,
                                               counts.data());
                    return band;
                }) &
            tbb::make_filter<int, void>(tbb::filter_mode::serial_in_order, [&](int band) {
                const size_t first = bandPixels * static_cast<size_t>(band);
                const size_t count = std::min(bandPixels, total - first);
                consume(static_cast<const float*>(pairs + 2 * first), count);
            }));

    entryCounts.assign(kTableSize, 0);
    for (const std::vector<int64_t>& counts : threadCounts)
        for (size_t entry = 0; entry < kTableSize; ++entry) entryCounts[entry] += counts[entry];
}

// Uninitialised floats for the pairs. Large buffers ask for huge pages:
// faulting in 4 KiB pages one by one costs a third of a 24-megapixel summary.
class PairBuffer {
public:
    explicit PairBuffer(size_t floats) {
        const size_t bytes = (floats * sizeof(float) + kHugePage - 1) / kHugePage * kHugePage;
        m_data = static_cast<float*>(std::aligned_alloc(kHugePage, bytes));
        if (m_data == nullptr) throw std::bad_alloc();
#ifdef MADV_HUGEPAGE
        if (bytes >= 4 * kHugePage) madvise(m_data, bytes, MADV_HUGEPAGE);  // advice only: failure is harmless
#endif
    }
    ~PairBuffer() { std::free(m_data); }
    PairBuffer(const PairBuffer&) = delete;
    PairBuffer& operator=(const PairBuffer&) = delete;
    float* get() const { return m_data; }

private:
    static constexpr size_t kHugePage = size_t{2} << 20;
    float* m_data;
};

// Adds the pairs to the two float sums in order. Out of line for the reason
// given below.
[[gnu::noinline]] void AddPairs(const float* pairs, size_t count, float& sumA, float& sumB) {
    float a = sumA, b = sumB;
    for (const float* const end = pairs + 2 * count; pairs != end; pairs += 2) {
        a = a + pairs[0];
        b = b + pairs[1];
    }
    sumA = a;
    sumB = b;
}

struct CentredProducts {
    double aa, ab, bb;
};

// Continues `sums` over the next `count` pairs. Kept out of line: inlined
// into its caller, GCC keeps the three sums in memory, which adds a store and
// a load to each addition this loop waits on.
[[gnu::noinline]] CentredProducts SumCentredProducts(const float* pairs, size_t count, float meanA, float meanB,
                                                     CentredProducts sums) {
    double aa = sums.aa, ab = sums.ab, bb = sums.bb;
    for (const float* const end = pairs + 2 * count; pairs != end; pairs += 2) {
        const double a = pairs[0] - meanA;
        const double b = pairs[1] - meanB;
        aa += a * a;
        ab += a * b;
        bb += b * b;
    }
    return {aa, ab, bb};
}

// Adds the next `count` pairs to the float sums as AddPairs does and, in the
// same loop, continues another image's centred products over the first
// `count` of `others` as SumCentredProducts does. The five sums are five
// independent chains, so one thread forms both in about the time of one.
[[gnu::noinline]] CentredProducts AddPairsAlongside(const float* pairs, size_t count, float& sumA, float& sumB,
                                                    const float* others, float meanA, float meanB,
                                                    CentredProducts sums) {
    float a = sumA, b = sumB;
    double aa = sums.aa, ab = sums.ab, bb = sums.bb;
    for (const float* const end = pairs + 2 * count; pairs != end; pairs += 2, others += 2) {
        a = a + pairs[0];
        b = b + pairs[1];
        const double otherA = others[0] - meanA;
        const double otherB = others[1] - meanB;
        aa += otherA * otherA;
        ab += otherA * otherB;
        bb += otherB * otherB;
    }
    sumA = a;
    sumB = b;
    return {aa, ab, bb};
}

// What the second pass and the lightness statistics need from the first.
struct FirstPassResult {
    size_t pixels = 0;
    float meanA = 0.0f, meanB = 0.0f;
    std::vector<int64_t> entryCounts;
};

// Converts the image into `pairs` (room for 2 x its pixels) and forms the
// chroma means as OpenCV's row reduction does: float sums in image order
// from the first pixel on, times the float of 1/n, plus a zero offset.
// add(pairs, count, sumA, sumB) continues the sums, as AddPairs does.
template <class Release, class Add>
FirstPassResult FirstPass(const cv::Mat& pixels8, ChannelOrder order, float* pairs, Release&& release, Add&& add) {
    FirstPassResult result;
    result.pixels = pixels8.total();
    float sumA = 0.0f, sumB = 0.0f;
    bool first = true;
    ConvertInBands(pixels8, order, pairs, result.entryCounts, release, [&](const float* band, size_t count) {
        if (first) {
            sumA = band[0];
            sumB = band[1];
            first = false;
            add(band + 2, count - 1, sumA, sumB);
        } else {
            add(band, count, sumA, sumB);
        }
    });
    const float scale = static_cast<float>(1.0 / (pixels8.rows * pixels8.cols));
    result.meanA = sumA * scale + 0.0f;
    result.meanB = sumB * scale + 0.0f;
    return result;
}

void NothingToRelease(size_t) {}

// Fills stats from the first pass and the second pass's sums: the products
// of the centred values (float differences, exact products in double) summed
// in image order, as OpenCV's transposed product forms each entry of the
// upper triangle.
void FinishStats(const FirstPassResult& pass, const CentredProducts& sums, ColourStats& stats) {
    const double sampleScale = 1.0 / static_cast<int>(pass.pixels);
    cv::Mat covariance(2, 2, CV_32F);
    covariance.at<float>(0, 0) = static_cast<float>(sums.aa * sampleScale);
    covariance.at<float>(0, 1) = covariance.at<float>(1, 0) = static_cast<float>(sums.ab * sampleScale);
    covariance.at<float>(1, 1) = static_cast<float>(sums.bb * sampleScale);

    stats.chromaMean[0] = pass.meanA;
    stats.chromaMean[1] = pass.meanB;
    cv::Mat root;
    MatrixSqrt(covariance, root);
    for (int i = 0; i < 4; ++i) stats.chromaSqrtCov[i] = root.at<float>(i / 2, i % 2);

    const LightnessLevels& levels = Levels();
    std::vector<int64_t> counts(levels.Count(), 0);
    for (size_t entry = 0; entry < kTableSize; ++entry) counts[levels.LevelOfEntry(entry)] += pass.entryCounts[entry];
    LightnessStatsFromCounts(counts, stats);
}

}  // namespace

void ConvertToLab(const cv::Mat& pixels8, cv::Mat& lab, ChannelOrder order) {
    if (pixels8.rows < 1) return;
    CV_Assert(pixels8.type() == CV_8UC3 && lab.type() == CV_32FC3 && lab.size() == pixels8.size());

    const LabByTables& convert = LabByTables::Get();
    const int columns = pixels8.cols;
    const int redOffset = order == ChannelOrder::Rgb ? 0 : 2;
    const int blueOffset = 2 - redOffset;
    // Each pixel on its own, so rows in parallel give the same bits.
    tbb::parallel_for(tbb::blocked_range<int>(0, pixels8.rows, 16), [&](const tbb::blocked_range<int>& rows) {
        for (int row = rows.begin(); row < rows.end(); ++row) {
            const uint8_t* in = pixels8.ptr<uint8_t>(row);
            float* out = lab.ptr<float>(row);
            for (int c = 0; c < columns; ++c, in += 3, out += 3) {
                size_t entry;
                const LabPixel pixel = convert(in[redOffset], in[1], in[blueOffset], entry);
                out[0] = pixel.lightness01;
                out[1] = pixel.a;
                out[2] = pixel.b;
            }
        }
    });
}

void SummariseColours(const cv::Mat& pixels8, ChannelOrder order, ColourStats& stats) {
    CV_Assert(pixels8.type() == CV_8UC3 && !pixels8.empty());
    FirstPassResult pass;
    CentredProducts sums{};
    {
        const PairBuffer pairs(2 * pixels8.total());
        pass = FirstPass(pixels8, order, pairs.get(), NothingToRelease, AddPairs);
        sums = SumCentredProducts(pairs.get(), pass.pixels, pass.meanA, pass.meanB, sums);
    }  // the pairs go before the lightness statistics allocate
    FinishStats(pass, sums, stats);
}

void SummariseColourPair(const cv::Mat& first, const cv::Mat& second, ChannelOrder order, ColourStats& firstStats,
                         ColourStats& secondStats) {
    CV_Assert(first.type() == CV_8UC3 && !first.empty() && second.type() == CV_8UC3 && !second.empty());
    FirstPassResult firstPass, secondPass;
    CentredProducts firstSums{}, secondSums{};
    {
        // One buffer for both: the first image's second pass reads its pairs
        // just ahead of the second image's conversion overwriting them, so
        // the pages are faulted in once and half the memory is enough.
        const PairBuffer pairs(2 * std::max(first.total(), second.total()));
        firstPass = FirstPass(first, order, pairs.get(), NothingToRelease, AddPairs);

        // The first image's products run in order from `summed` on, under
        // `lock`. Mostly the second image's sums carry them along, band by
        // band; a band about to be converted over pairs not yet summed waits
        // for them (release). A band is converted only after `summed` passes
        // its end, so pairs from `summed` on are always the first image's.
        std::mutex lock;
        std::atomic<size_t> summed{0};
        const auto release = [&](size_t end) {
            end = std::min(end, firstPass.pixels);
            if (summed.load(std::memory_order_acquire) >= end) return;
            const std::lock_guard<std::mutex> hold(lock);
            const size_t from = summed.load(std::memory_order_relaxed);
            if (from >= end) return;
            firstSums = SumCentredProducts(pairs.get() + 2 * from, end - from, firstPass.meanA, firstPass.meanB,
                                           firstSums);
            summed.store(end, std::memory_order_release);
        };
        const auto addAlongside = [&](const float* band, size_t count, float& sumA, float& sumB) {
            const std::lock_guard<std::mutex> hold(lock);
            const size_t from = summed.load(std::memory_order_relaxed);
            const size_t along = std::min(count, firstPass.pixels - from);
            firstSums = AddPairsAlongside(band, along, sumA, sumB, pairs.get() + 2 * from, firstPass.meanA,
                                          firstPass.meanB, firstSums);
            AddPairs(band + 2 * along, count - along, sumA, sumB);
            summed.store(from + along, std::memory_order_release);
        };
        secondPass = FirstPass(second, order, pairs.get(), release, addAlongside);
        release(firstPass.pixels);
        secondSums = SumCentredProducts(pairs.get(), secondPass.pixels, secondPass.meanA, secondPass.meanB, secondSums);
    }
    FinishStats(firstPass, firstSums, firstStats);
    FinishStats(secondPass, secondSums, secondStats);
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
