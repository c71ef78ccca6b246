#include "modelkit/Qres.h"

#include <fstream>
#include <set>
#include <sstream>
#include <stdexcept>

#include <zlib.h>

#include "model/Utf8.h"

namespace vora {
namespace modelkit {
namespace {

constexpr uint16_t kFlagZlib = 1;
constexpr uint16_t kFlagDirectory = 2;
constexpr uint16_t kFlagZstd = 4;

// No photograph comes near this; a larger claim means a corrupt size word.
constexpr uint32_t kMaxFileSize = 512u << 20;

// Deeper nesting than this can only come from a tree that points back into
// itself.
constexpr int kMaxDepth = 64;

class Archive {
public:
    explicit Archive(const std::string& bytes) : m_bytes(bytes) {
        if (bytes.size() < 20 || bytes.compare(0, 4, "qres") != 0)
            throw std::runtime_error("not a Qt resource archive (no 'qres' header)");
        m_version = U32(4);
        if (m_version < 1 || m_version > 3)
            throw std::runtime_error("unsupported Qt resource archive version " + std::to_string(m_version));
        m_tree = U32(8);
        m_data = U32(12);
        m_names = U32(16);
        m_entrySize = m_version >= 2 ? 22 : 14;
    }

    std::vector<QresFile> Files() {
        std::vector<QresFile> files;
        const uint16_t rootFlags = U16(EntryOffset(0) + 4);
        if (!(rootFlags & kFlagDirectory)) throw std::runtime_error("Qt resource archive: the root is not a directory");
        Walk(0, "", 0, files);
        return files;
    }

private:
    uint32_t U32(uint64_t at) const {
        Need(at, 4);
        const auto* p = reinterpret_cast<const unsigned char*>(m_bytes.data() + at);
        return (uint32_t(p[0]) << 24) | (uint32_t(p[1]) << 16) | (uint32_t(p[2]) << 8) | uint32_t(p[3]);
    }

    uint16_t U16(uint64_t at) const {
        Need(at, 2);
        const auto* p = reinterpret_cast<const unsigned char*>(m_bytes.data() + at);
        return static_cast<uint16_t>((p[0] << 8) | p[1]);
    }

    void Need(uint64_t at, uint64_t count) const {
        if (at + count > m_bytes.size()) throw std::runtime_error("Qt resource archive is truncated or corrupt");
    }

    uint64_t EntryOffset(uint64_t index) const { return uint64_t(m_tree) + index * m_entrySize; }

    std::string Name(uint32_t nameOffset) const {
        const uint64_t at = uint64_t(m_names) + nameOffset;
        const uint16_t units = U16(at);
        Need(at + 6, uint64_t(units) * 2);
        std::string utf8;
        for (uint32_t i = 0; i < units; ++i) {
            uint32_t code = U16(at + 6 + 2 * i);
            if (code >= 0xD800 && code < 0xDC00 && i + 1 < units) {
                const uint32_t low = U16(at + 6 + 2 * (i + 1));
                if (low >= 0xDC00 && low < 0xE000) {
                    code = 0x10000 + ((code - 0xD800) << 10) + (low - 0xDC00);
                    ++i;
                }
            }
            AppendUtf8(utf8, code);
        }
        if (utf8.empty() || utf8 == "." || utf8 == ".." || utf8.find('/') != std::string::npos ||
            utf8.find('\0') != std::string::npos)
            throw std::runtime_error("Qt resource archive holds an unsafe file name");
        return utf8;
    }

    std::string Data(const std::string& path, uint16_t flags, uint32_t dataOffset) const {
        const uint64_t at = uint64_t(m_data) + dataOffset;
        const uint32_t size = U32(at);
        Need(at + 4, size);
        std::string stored = m_bytes.substr(at + 4, size);
        if (flags & kFlagZstd)
            throw std::runtime_error("Qt resource archive: " + path + " is zstd-compressed, which this reader does not support");
        if (!(flags & kFlagZlib)) return stored;

        // zlib data carry their uncompressed size first (big-endian).
        if (stored.size() < 4) throw std::runtime_error("Qt resource archive: compressed " + path + " is truncated");
        const auto* p = reinterpret_cast<const unsigned char*>(stored.data());
        const uint32_t expected = (uint32_t(p[0]) << 24) | (uint32_t(p[1]) << 16) | (uint32_t(p[2]) << 8) | uint32_t(p[3]);
        if (expected > kMaxFileSize) throw std::runtime_error("Qt resource archive: " + path + " claims an absurd size");
        std::string out(expected, '\0');
        uLongf outSize = expected;
        const int rc = uncompress(reinterpret_cast<Bytef*>(out.empty() ? nullptr : &out[0]), &outSize,
                                  p + 4, static_cast<uLong>(stored.size() - 4));
        if (expected == 0 && rc == Z_BUF_ERROR) return out;
        if (rc != Z_OK || outSize != expected)
            throw std::runtime_error("Qt resource archive: " + path + " does not decompress");
        return out;
    }

    void Walk(uint32_t index, const std::string& prefix, int depth, std::vector<QresFile>& files) {
        if (depth > kMaxDepth) throw std::runtime_error("Qt resource archive: the tree is nested too deep");
        // A tree that points back into itself would otherwise never end.
        if (!m_visited.insert(index).second) throw std::runtime_error("Qt resource archive: the tree loops");
        const uint64_t entry = EntryOffset(index);
        Need(entry, m_entrySize);
        const uint16_t flags = U16(entry + 4);
        if (flags & kFlagDirectory) {
            const uint32_t count = U32(entry + 6);
            const uint32_t first = U32(entry + 10);
            // Each child needs its own entry inside the archive.
            Need(EntryOffset(first), uint64_t(count) * m_entrySize);
            for (uint32_t i = 0; i < count; ++i) {
                const uint64_t child = EntryOffset(uint64_t(first) + i);
                const std::string name = Name(U32(child));
                Walk(first + i, prefix + name + ((U16(child + 4) & kFlagDirectory) ? "/" : ""), depth + 1, files);
            }
        } else {
            files.push_back({prefix, Data(prefix, flags, U32(entry + 10))});
        }
    }

    const std::string& m_bytes;
    uint32_t m_version = 0;
    uint32_t m_tree = 0;
    uint32_t m_data = 0;
    uint32_t m_names = 0;
    uint32_t m_entrySize = 22;
    std::set<uint32_t> m_visited;
};

}  // namespace

std::vector<QresFile> ReadQres(const std::string& bytes) {
    Archive archive(bytes);
    return archive.Files();
}

std::vector<QresFile> ReadQresFile(const std::string& path) {
    std::ifstream file(path, std::ios::binary);
    if (!file) throw std::runtime_error("cannot open " + path);
    std::ostringstream buffer;
    buffer << file.rdbuf();
    try {
        return ReadQres(buffer.str());
    } catch (const std::runtime_error& e) {
        throw std::runtime_error(path + ": " + e.what());
    }
}

}  // namespace modelkit
}  // namespace vora
