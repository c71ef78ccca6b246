#pragma once

#include <cstdint>
#include <cstring>
#include <string>
#include <vector>

#include <opencv2/core.hpp>

namespace vora {

// Varint and fixed-width fields of the weights format, for the mean blob.
class WireReader {
public:
    WireReader(const uint8_t* data, size_t size) : m_data(data), m_end(data + size) {}
    bool AtEnd() const { return m_data >= m_end; }

    uint64_t Varint() {
        uint64_t value = 0;
        for (int shift = 0; shift < 64; shift += 7) {
            Need(1);
            const uint8_t byte = *m_data++;
            value |= static_cast<uint64_t>(byte & 0x7F) << shift;
            if ((byte & 0x80) == 0) return value;
        }
        Bad("overlong varint");
    }

    template <typename T>
    T Fixed() {
        Need(sizeof(T));
        T value;
        std::memcpy(&value, m_data, sizeof(T));  // little-endian, as this machine
        m_data += sizeof(T);
        return value;
    }

    WireReader Sub() {
        const uint64_t length = Varint();
        Need(length);
        WireReader sub(m_data, static_cast<size_t>(length));
        m_data += length;
        return sub;
    }

    void Skip(int wireType) {
        switch (wireType) {
            case 0: Varint(); break;
            case 1: Need(8); m_data += 8; break;
            case 2: Sub(); break;
            case 5: Need(4); m_data += 4; break;
            default: Bad("unsupported wire type " + std::to_string(wireType));
        }
    }

    [[noreturn]] static void Bad(const std::string& what) {
        CV_Error(cv::Error::StsParseError, "mean file: " + what);
    }

private:
    void Need(uint64_t bytes) const {
        if (bytes > static_cast<uint64_t>(m_end - m_data)) Bad("truncated");
    }

    const uint8_t* m_data;
    const uint8_t* m_end;
};

// Repeated numeric field, packed (wire type 2) or one value per key.
template <typename T, typename Read>
void ReadRepeated(WireReader& reader, int wireType, int scalarWireType, std::vector<T>& out, Read read) {
    if (wireType == 2) {
        WireReader packed = reader.Sub();
        while (!packed.AtEnd()) out.push_back(read(packed));
    } else if (wireType == scalarWireType) {
        out.push_back(read(reader));
    } else {
        reader.Skip(wireType);
    }
}

}  // namespace vora
