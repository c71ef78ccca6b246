// The two image classes share every operation; only the creating functions
// differ (whole-image versus full-width row stride).
#include <vora/vora.h>

#include <new>

namespace vora {

struct ImageObjectAccess {
    template <class Image>
    static Image* Create(size_t height, size_t width, size_t channels, const size_t* layoutValues,
                         CFullResImageSize fullResSize, CTopLeftCoordinate topLeft) {
        Image* image = new (std::nothrow) Image();
        if (!image) return nullptr;
        image->width = width;
        image->height = height;
        image->channels = channels;
        image->topLeft = topLeft;
        image->fullResSize = fullResSize;
        // A null layout pointer reads as four zeros rather than faulting.
        for (int i = 0; i < 4; ++i) image->layoutValues[i] = layoutValues ? layoutValues[i] : 0;
        return image;
    }

    static IImage* Whole(size_t height, size_t width, size_t channels, const size_t* layoutValues,
                         uint8_t* pixels, CFullResImageSize fullResSize, CTopLeftCoordinate topLeft) {
        CRGB8Image* image = Create<CRGB8Image>(height, width, channels, layoutValues, fullResSize, topLeft);
        // Without pixels the object is geometry only; its strides stay unset.
        if (image && pixels) {
            image->rowStride = width * channels;
            image->pixelStride = channels;
            image->byteSize = width * channels * height;
            image->pixels = pixels;
        }
        return image;
    }

    static IImage* Tile(size_t height, size_t width, size_t channels, const size_t* layoutValues,
                        uint8_t* pixels, CFullResImageSize fullResSize, CTopLeftCoordinate topLeft) {
        CTileImage* tile = Create<CTileImage>(height, width, channels, layoutValues, fullResSize, topLeft);
        if (tile) {
            // Rows of a tile are a full image width apart.
            tile->rowStride = fullResSize.width * channels;
            tile->pixelStride = channels;
            tile->byteSize = fullResSize.width * channels * height;
            tile->pixels = pixels;
        }
        return tile;
    }
};

#define VORA_IMAGE_OPERATIONS(Class)                                                        \
    Class::~Class() { pixels = nullptr; }                                                   \
    uint32_t Class::Release() {                                                             \
        const uint32_t before = refCount.fetch_sub(1, std::memory_order_acq_rel);           \
        if (before == 1) delete this;                                                       \
        return before - 1;                                                                  \
    }                                                                                       \
    uint32_t Class::AddRef() { return refCount.fetch_add(1, std::memory_order_relaxed); }   \
    void Class::Destroy() { delete this; }                                                  \
    uint8_t* Class::GetData() { return pixels; }                                            \
    const uint8_t* Class::GetConstData() const { return pixels; }                           \
    size_t Class::GetWidth() const { return width; }                                        \
    size_t Class::GetHeight() const { return height; }                                      \
    size_t Class::GetChannels() const { return channels; }                                  \
    size_t Class::GetRowStride() const { return rowStride; }                                \
    size_t Class::GetPixelStride() const { return pixelStride; }                            \
    size_t Class::GetLayoutValue(int index) const {                                        \
        return index >= 0 && index < 4 ? layoutValues[index] : 0; /* out of range reads 0 */ \
    }                                                                                       \
    CTopLeftCoordinate Class::GetTopLeft() const { return topLeft; }                        \
    CFullResImageSize Class::GetFullResSize() const { return fullResSize; }

VORA_IMAGE_OPERATIONS(CRGB8Image)
VORA_IMAGE_OPERATIONS(CTileImage)

#undef VORA_IMAGE_OPERATIONS

extern "C" {

IImage* CreateImageObj(size_t height, size_t width, size_t channels, const size_t* layoutValues,
                       uint8_t* pixels, CFullResImageSize fullResSize, CTopLeftCoordinate topLeft) {
    return ImageObjectAccess::Whole(height, width, channels, layoutValues, pixels, fullResSize, topLeft);
}

IImage* GetTileImageObj(size_t height, size_t width, size_t channels, const size_t* layoutValues,
                        uint8_t* pixels, CFullResImageSize fullResSize, CTopLeftCoordinate topLeft) {
    return ImageObjectAccess::Tile(height, width, channels, layoutValues, pixels, fullResSize, topLeft);
}

void DestroyImageObj(IImage* image) { image->Destroy(); }

void ReturnTileImageObj(IImage* tile) { tile->Destroy(); }

}  // extern "C"

}  // namespace vora
