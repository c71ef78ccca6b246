// vora: automatic colour restyling of photographs.
//
// Usage:
//
//   vora::vora_api api("./model/");                        // loads the model once
//   size_t layout[4] = {0, 0, 0, 0};
//   vora::IImage* photo = vora::CreateImageObj(h, w, 3, layout, rgb, {w, h}, {0, 0});
//   vora::VoraParameters params;                           // 5 proposals, factors 1.0
//   std::vector<vora::TRANSFER> proposals(params.numTransfers);
//   if (api.compute_transfers(photo, proposals, params) == vora::STATUS_OK)
//       api.apply_transfer(photo, proposals[0], photo);    // restyle in place
//   vora::DestroyImageObj(photo);
//
// This header needs only the C++ standard library: no OpenCV or TBB type appears here.

#ifndef VORA_VORA_H
#define VORA_VORA_H

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

// ===========================================================================
// Export and version macros
// ===========================================================================

// VORA_VERSION_MAJOR, _MINOR, _PATCH and VORA_VERSION_STRING, generated from
// the project's version.
#include <vora/version.h>

#if defined(_WIN32)
#define VORA_API __declspec(dllexport)
#else
#define VORA_API __attribute__((visibility("default")))
#endif

// ===========================================================================
// Common principles
// ===========================================================================
//
// Ownership. The host owns every pixel buffer and every face-rectangle array.
// Image objects (IImage) only describe host memory; destroying them never
// frees or changes pixels. The library keeps no reference to an image after
// a call returns. TRANSFER records are plain values owned by whoever holds
// them. A vora_api owns its engine (the loaded model).
//
// Pixels. 8 bits per channel, R, G, B within a pixel. The compute operations
// read whole, tightly packed three-channel images (rows of exactly width x 3
// bytes); apply_transfer reads and writes whole images or tiles through the
// source's strides.
//
// Coordinates. Face rectangles are normalised: 0..1 across the width and the
// height of the content image, y growing downward. Tiles carry their top-left
// position and the full-resolution size, so apply computes every position
// term in full-image coordinates and tiles join without seams.
//
// Threads. apply_transfer runs in parallel (TBB) and blocks until done. The
// compute_transfer forms and apply_transfer only read the engine and may run
// concurrently on one facade. The compute_transfers forms run the network,
// whose buffers live in the engine: two of them must not overlap on one
// facade. Construction, destruction and assignment overlap nothing.
//
// Failures. Operations return a Status. STATUS_OK is the result of every call
// inside the contract. The other values report input outside the contract
// that would otherwise hang the call or touch memory out of bounds; such a
// call writes nothing. Errors of the dependencies (a null pixel pointer with
// a non-zero size, exhausted memory, an unreadable network file) pass out as
// the dependency's exceptions; no exported operation catches them.
//
// Diagnostics. Two fixed lines only: "Could not open or find the image" on
// standard error and "Correct %d faces!!\n" on standard output.

namespace vora {

// ===========================================================================
// Records
// ===========================================================================

/// Result of every facade operation.
enum Status : int32_t {
    STATUS_OK = 0,
    /// A required pointer is null (facade, image object, record array,
    /// parameters), source and destination of apply differ in geometry or have
    /// fewer than three bytes a pixel, or the vector given to compute_transfers
    /// holds fewer than numTransfers records.
    STATUS_INVALID_ARGUMENT = 1,
    /// numTransfers is 0: style selection needs room for at least one choice.
    STATUS_NO_TRANSFERS_REQUESTED = 2,
    /// The model's tables are empty or do not agree with each other (a data
    /// file was missing or rejected at load time), or its network gives fewer
    /// than 512 values, so styles cannot be ranked.
    STATUS_MODEL_INCOMPLETE = 3,
    /// The nearest cluster's ranking holds no valid style, so the selection
    /// could never finish.
    STATUS_NO_USABLE_STYLE = 4,
    /// A style index outside the style database.
    STATUS_STYLE_INDEX_OUT_OF_RANGE = 5,
    /// A solved transfer holds a value that is not a finite number (a style
    /// record holding NaN or infinity, for example); nothing is written.
    STATUS_NON_FINITE_RESULT = 6,
};

/// Rectangle of four doubles, edges inclusive as for pixel indices.
class VORA_API CDoubleRect {
public:
    CDoubleRect() : left(0.0), right(0.0), top(0.0), bottom(0.0) {}
    CDoubleRect(double l, double r, double t, double b) : left(l), right(r), top(t), bottom(b) {}
    /// (bottom - top + 1) x (right - left + 1); does not check emptiness.
    double Area() const { return (bottom - top + 1.0) * (right - left + 1.0); }
    /// True when left > right or top > bottom (strict comparisons).
    bool Empty() const { return left > right || top > bottom; }

    double left;
    double right;
    double top;
    double bottom;
};

/// A face in normalised image coordinates (0..1, y downward).
class VORA_API CFaceRect {
public:
    CFaceRect(double l, double r, double t, double b) : left(l), right(r), top(t), bottom(b) {}

    double left;
    double right;
    double top;
    double bottom;
};

/// Size in pixels of the full-resolution image a tile belongs to.
class VORA_API CFullResImageSize {
public:
    CFullResImageSize() : width(0), height(0) {}
    CFullResImageSize(uint64_t w, uint64_t h) : width(w), height(h) {}
    uint64_t GetImageWidth() { return width; }
    uint64_t GetImageHeight() { return height; }

    uint64_t width;
    uint64_t height;
};

/// Position in pixels of a tile's first pixel within the full image.
class VORA_API CTopLeftCoordinate {
public:
    CTopLeftCoordinate() : left(0), top(0) {}
    CTopLeftCoordinate(uint64_t l, uint64_t t) : left(l), top(t) {}
    uint64_t GetLeftCoordinate() { return left; }
    uint64_t GetTopCoordinate() { return top; }

    uint64_t left;
    uint64_t top;
};

/// Per-call parameters. The face array is the caller's and must stay valid
/// for the duration of each call that receives the record; copies share it.
class VORA_API VoraParameters {
public:
    VoraParameters()
        : numTransfers(5), rankingFactor(1.0f), solveFactor(1.0f), limitFactor(1.0f),
          finishFactor(1.0f), faceRects(nullptr), numFaceRects(0) {}

    /// Forgets the face array (frees nothing).
    void SetDefaultFaceRects() {
        faceRects = nullptr;
        numFaceRects = 0;
    }
    const CFaceRect* getFaceRects() const { return faceRects; }
    uint32_t getNumberOfFaceRects() const { return numFaceRects; }
    /// True exactly when there is a non-null array with a non-zero count.
    bool isVoraParameterHavingFaces() const { return numFaceRects > 0 && faceRects != nullptr; }

    uint64_t numTransfers;   ///< transfers compute_transfers produces (at least 1)
    float rankingFactor;     ///< minimum distance between chosen styles: x 15.0
    float solveFactor;       ///< floor of the content's chroma spread: x 15.0
    float limitFactor;       ///< lightness move above which the move is limited: x 0.2
    float finishFactor;      ///< target lightness of face correction: x 0.5
    const CFaceRect* faceRects;
    uint32_t numFaceRects;
};

/// One corrected face: where it is and what the transfer made of it.
struct FaceCorrection {
    float centreX;     ///< (left + right) / 2, normalised
    float centreY;     ///< middle of the face plus one eighth of its height
    float halfSizeX;   ///< 0.28 x face width
    float halfSizeY;   ///< 0.28 x face height
    float measuredL;   ///< median lightness (L*/100) after the transfer
    float measuredA;   ///< median a* after the transfer
    float measuredB;   ///< median b* after the transfer
    float exponent;    ///< max(0.5, measured L / target)
};
static_assert(sizeof(FaceCorrection) == 32, "a face correction is eight floats");

/// The result of one transfer computation: everything apply needs besides the
/// images. A value: copy it, keep it, hand it back unchanged.
struct VORA_API TRANSFER {
    int32_t clusterIndex = 0;     ///< cluster the style was proposed through, or -1
    int32_t styleIndex = 0;       ///< style database index, or -1 for a style image
    float contentMean[2] = {};    ///< content mean a*, b*
    float styleMean[2] = {};      ///< style mean a*, b*
    float chromaMatrix[4] = {};   ///< 2x2 chroma map, row-major
    float toneCurve[257] = {};    ///< lightness curve at i/255, plus a guard entry
    float lightnessLow = 0.0f;    ///< content lightness at the 0.5 % point
    float lightnessHigh = 0.0f;   ///< content lightness at the 99.5 % point
    std::vector<FaceCorrection> faceCorrections;
};

// ===========================================================================
// Image objects
// ===========================================================================

/// Interface root: reference counting. Objects are released with Release,
/// Destroy, DestroyImageObj or ReturnTileImageObj, never with delete.
class VORA_API IBaseClass {
public:
    IBaseClass() = default;
    IBaseClass(const IBaseClass&) = default;
    IBaseClass& operator=(const IBaseClass&) = default;
    /// Decrements the count; deletes the object when it falls from 1 to 0.
    /// The result after a deletion is undefined.
    virtual uint32_t Release() = 0;
    /// Increments the count; returns the count before the increment.
    virtual uint32_t AddRef() = 0;

protected:
    virtual ~IBaseClass() = default;
};

/// Describes host-owned 8-bit pixels: geometry, strides and, for a tile, its
/// place in the full-resolution image. All fields are fixed at creation.
class VORA_API IImage : public IBaseClass {
public:
    IImage() = default;
    IImage(const IImage&) = default;
    IImage& operator=(const IImage&) = default;
    /// Deletes the object at once, whatever the count; pixels are untouched.
    virtual void Destroy() = 0;
    /// The first byte of the first pixel (the host's memory; not owned).
    virtual uint8_t* GetData() = 0;
    /// The same pointer, for reading.
    virtual const uint8_t* GetConstData() const = 0;
    /// Pixels per row of this image (of the tile, for a tile).
    virtual size_t GetWidth() const = 0;
    /// Rows of this image (of the tile, for a tile).
    virtual size_t GetHeight() const = 0;
    /// Channels the host declared; the library reads and writes the first three.
    virtual size_t GetChannels() const = 0;
    /// Bytes from one row to the next.
    virtual size_t GetRowStride() const = 0;
    /// Bytes from one pixel to the next (at least 3 for the library to use it).
    virtual size_t GetPixelStride() const = 0;
    /// Entry index (0..3) of the host's layout values; not range-checked.
    virtual size_t GetLayoutValue(int index) const = 0;
    /// Where this image sits in the full-resolution image, in pixels ((0, 0)
    /// for a whole image).
    virtual CTopLeftCoordinate GetTopLeft() const = 0;
    /// Size of the full-resolution image this one is (a tile of).
    virtual CFullResImageSize GetFullResSize() const = 0;

protected:
    ~IImage() override = default;
};

/// Empty base that forbids copying.
class VORA_API CPolicyNoCopy {
public:
    CPolicyNoCopy() = default;
    CPolicyNoCopy(const CPolicyNoCopy&) = delete;
    CPolicyNoCopy& operator=(const CPolicyNoCopy&) = delete;
};

/// Holds the atomic reference count of an image object.
class VORA_API CRefCount : private CPolicyNoCopy {
public:
    CRefCount() : refCount(1) {}
    virtual ~CRefCount() = default;

protected:
    std::atomic<uint32_t> refCount;
};

/// Whole image over caller-owned pixels (made by CreateImageObj).
class VORA_API CRGB8Image : public IImage, public CRefCount {
public:
    uint32_t Release() override;
    uint32_t AddRef() override;
    void Destroy() override;
    uint8_t* GetData() override;
    const uint8_t* GetConstData() const override;
    size_t GetWidth() const override;
    size_t GetHeight() const override;
    size_t GetChannels() const override;
    size_t GetRowStride() const override;
    size_t GetPixelStride() const override;
    size_t GetLayoutValue(int index) const override;
    CTopLeftCoordinate GetTopLeft() const override;
    CFullResImageSize GetFullResSize() const override;

protected:
    ~CRGB8Image() override;

private:
    friend struct ImageObjectAccess;
    CRGB8Image() = default;

    uint8_t* pixels = nullptr;
    size_t width = 0;
    size_t height = 0;
    size_t channels = 0;
    size_t rowStride = 0;   // left 0 for a pixel-less image: it is geometry only
    size_t pixelStride = 0;
    size_t byteSize = 0;
    size_t layoutValues[4] = {};
    CTopLeftCoordinate topLeft;
    CFullResImageSize fullResSize;
};

/// Tile of a larger image (made by GetTileImageObj): rows are a full image
/// width apart.
class VORA_API CTileImage : public IImage, public CRefCount {
public:
    uint32_t Release() override;
    uint32_t AddRef() override;
    void Destroy() override;
    uint8_t* GetData() override;
    const uint8_t* GetConstData() const override;
    size_t GetWidth() const override;
    size_t GetHeight() const override;
    size_t GetChannels() const override;
    size_t GetRowStride() const override;
    size_t GetPixelStride() const override;
    size_t GetLayoutValue(int index) const override;
    CTopLeftCoordinate GetTopLeft() const override;
    CFullResImageSize GetFullResSize() const override;

protected:
    ~CTileImage() override;

private:
    friend struct ImageObjectAccess;
    CTileImage() = default;

    uint8_t* pixels = nullptr;
    size_t width = 0;
    size_t height = 0;
    size_t channels = 0;
    size_t rowStride = 0;
    size_t pixelStride = 0;
    size_t byteSize = 0;
    size_t layoutValues[4] = {};
    CTopLeftCoordinate topLeft;
    CFullResImageSize fullResSize;
};

// ===========================================================================
// Facade
// ===========================================================================

struct Engine;

/// The library's one class: a loaded model and the operations on it.
/// Exactly one pointer wide. Not copy-constructible; assignment shares the
/// engine without counting (destroy only one of the two facades).
class VORA_API vora_api {
public:
    /// Loads "./model/". A missing data file leaves the model incomplete
    /// (calls then return STATUS_MODEL_INCOMPLETE); a missing or unreadable
    /// network file throws the network loader's exception.
    vora_api();
    explicit vora_api(const char* modelDir);
    explicit vora_api(const std::string& modelDir);
    ~vora_api();
    vora_api(const vora_api&) = delete;
    /// Copies the engine pointer only; the engine held before is not released.
    vora_api& operator=(const vora_api& other);

    /// Chooses params.numTransfers styles for the content image and computes a
    /// transfer for each, with face corrections, into out[0..numTransfers-1].
    /// out must already hold at least numTransfers records; extra ones are left
    /// alone. Not to be overlapped with another compute_transfers on this facade.
    Status compute_transfers(const IImage* content, std::vector<TRANSFER>& out,
                             const VoraParameters& params) const;
    /// Array form: out must hold params.numTransfers initialised records.
    Status compute_transfers(const IImage* content, TRANSFER* out, const VoraParameters& params) const;
    /// One transfer toward a style image (any size); no face corrections;
    /// clusterIndex and styleIndex become -1.
    Status compute_transfer(const IImage* content, const IImage* style, TRANSFER& out,
                            const VoraParameters& params) const;
    /// One transfer toward database style styleIndex; no face corrections.
    Status compute_transfer(const IImage* content, int styleIndex, TRANSFER& out,
                            const VoraParameters& params) const;
    /// Rewrites source (whole image or tile) into destination, which has the
    /// same geometry and may be the same object. Runs in parallel.
    Status apply_transfer(const IImage* source, const TRANSFER& transfer, IImage* destination) const;

    /// Placeholder: reads the image, stores nothing, leaves index unchanged.
    Status add_style(const IImage* style, int& index);
    /// Placeholder: changes nothing.
    Status remove_style(const int& index);
    /// Placeholder: changes nothing.
    Status customize_style_preference(const std::vector<int>& preference);

private:
    Engine* engine;
};

// ===========================================================================
// Plain functions (unmangled names)
// ===========================================================================

extern "C" {

/// New whole image over caller pixels (which may be null: geometry only).
/// layoutValues points at four values that are copied. Null only when the
/// allocation yields nothing.
VORA_API IImage* CreateImageObj(size_t height, size_t width, size_t channels, const size_t* layoutValues,
                                uint8_t* pixels, CFullResImageSize fullResSize, CTopLeftCoordinate topLeft);
/// New tile: pixels is the tile's first pixel inside the full image, rows are
/// fullResSize.width x channels bytes apart.
VORA_API IImage* GetTileImageObj(size_t height, size_t width, size_t channels, const size_t* layoutValues,
                                 uint8_t* pixels, CFullResImageSize fullResSize, CTopLeftCoordinate topLeft);
/// Deletes an image object (whole or tile) at once; pixels are untouched.
VORA_API void DestroyImageObj(IImage* image);
/// The same operation as DestroyImageObj.
VORA_API void ReturnTileImageObj(IImage* tile);

/// new vora_api(modelDir); null if the allocation yields nothing.
VORA_API vora_api* CreateVoraObj(const char* modelDir);
/// Destroys a facade made by CreateVoraObj; null does nothing.
VORA_API void DestroyVoraObj(vora_api* obj);
/// The array form of vora_api::compute_transfers.
VORA_API Status compute_transfers(vora_api* obj, const IImage* content, TRANSFER* out,
                                  const VoraParameters* params);
/// vora_api::apply_transfer.
VORA_API Status apply_transfer(vora_api* obj, const IImage* source, const TRANSFER* transfer,
                               IImage* destination);

}  // extern "C"

}  // namespace vora

#endif  // VORA_VORA_H
