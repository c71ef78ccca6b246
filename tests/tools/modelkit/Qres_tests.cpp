#include "modelkit/Qres.h"

#include <stdexcept>

#include <gtest/gtest.h>
#include <zlib.h>

using namespace vora::modelkit;

namespace {

// Builds an archive byte by byte from the layout: header, data, names, tree.
class ArchiveWriter {
public:
    explicit ArchiveWriter(int version) : m_version(version) {}

    // Entries in tree order; children of a directory are consecutive.
    void Directory(const std::u16string& name, uint32_t children, uint32_t firstChild) {
        m_entries.push_back({Name(name), 2, children, firstChild, 0});
    }
    void File(const std::u16string& name, const std::string& content, uint16_t flags = 0) {
        std::string stored = content;
        if (flags & 1) {
            uLongf size = compressBound(content.size());
            std::string packed(size, '\0');
            compress(reinterpret_cast<Bytef*>(&packed[0]), &size, reinterpret_cast<const Bytef*>(content.data()), content.size());
            packed.resize(size);
            stored.clear();
            Put32(stored, static_cast<uint32_t>(content.size()));
            stored += packed;
        }
        const uint32_t offset = static_cast<uint32_t>(m_data.size());
        Put32(m_data, static_cast<uint32_t>(stored.size()));
        m_data += stored;
        m_entries.push_back({Name(name), flags, 0, 0, offset});
    }

    std::string Bytes() const {
        const uint32_t header = m_version >= 3 ? 24 : 20;
        const uint32_t data = header;
        const uint32_t names = data + static_cast<uint32_t>(m_data.size());
        const uint32_t tree = names + static_cast<uint32_t>(m_names.size());
        std::string out = "qres";
        Put32(out, m_version);
        Put32(out, tree);
        Put32(out, data);
        Put32(out, names);
        if (m_version >= 3) Put32(out, 0);
        out += m_data;
        out += m_names;
        for (const Entry& e : m_entries) {
            Put32(out, e.name);
            Put16(out, e.flags);
            if (e.flags & 2) {
                Put32(out, e.children);
                Put32(out, e.first);
            } else {
                Put16(out, 0);  // country
                Put16(out, 1);  // language
                Put32(out, e.data);
            }
            if (m_version >= 2) out += std::string(8, '\x11');  // modification time
        }
        return out;
    }

private:
    struct Entry {
        uint32_t name;
        uint16_t flags;
        uint32_t children, first, data;
    };

    static void Put16(std::string& out, uint32_t v) {
        out.push_back(static_cast<char>(v >> 8));
        out.push_back(static_cast<char>(v));
    }
    static void Put32(std::string& out, uint32_t v) {
        Put16(out, v >> 16);
        Put16(out, v & 0xFFFF);
    }
    uint32_t Name(const std::u16string& name) {
        const uint32_t offset = static_cast<uint32_t>(m_names.size());
        Put16(m_names, static_cast<uint32_t>(name.size()));
        Put32(m_names, 0x12345678);  // hash: not used for reading
        for (char16_t unit : name) Put16(m_names, unit);
        return offset;
    }

    int m_version;
    std::string m_data, m_names;
    std::vector<Entry> m_entries;
};

ArchiveWriter Sample(int version) {
    ArchiveWriter archive(version);
    archive.Directory(u"", 2, 1);              // 0: root
    archive.Directory(u"photos", 2, 3);        // 1
    archive.File(u"readme.txt", "plain bytes");  // 2
    archive.File(u"caf\u00e9 \U0001F600.webp", std::string(5000, 'x') + "tail", 1);  // 3: zlib, non-ASCII name
    archive.File(u"empty", "", 0);             // 4
    return archive;
}

}  // namespace

TEST(Qres, ReadsEveryVersionWithPathsAndCompressedData) {
    for (int version : {1, 2, 3}) {
        const std::vector<QresFile> files = ReadQres(Sample(version).Bytes());
        ASSERT_EQ(files.size(), 3u) << "version " << version;
        EXPECT_EQ(files[0].path, "photos/caf\xc3\xa9 \xf0\x9f\x98\x80.webp");
        EXPECT_EQ(files[0].data, std::string(5000, 'x') + "tail");
        EXPECT_EQ(files[1].path, "photos/empty");
        EXPECT_EQ(files[1].data, "");
        EXPECT_EQ(files[2].path, "readme.txt");
        EXPECT_EQ(files[2].data, "plain bytes");
    }
}

TEST(Qres, RefusesMalformedArchivesInWords) {
    auto message = [](const std::string& bytes) -> std::string {
        try {
            ReadQres(bytes);
        } catch (const std::runtime_error& e) {
            return e.what();
        }
        return "accepted";
    };
    const std::string good = Sample(3).Bytes();
    EXPECT_EQ(message("PK\x03\x04" + good.substr(4)), "not a Qt resource archive (no 'qres' header)");
    std::string future = good;
    future[7] = 9;
    EXPECT_EQ(message(future), "unsupported Qt resource archive version 9");
    for (size_t cut : {size_t(30), good.size() - 1, good.size() - 30})
        EXPECT_EQ(message(good.substr(0, cut)), "Qt resource archive is truncated or corrupt") << cut;

    ArchiveWriter loop(2);
    loop.Directory(u"", 1, 1);
    loop.Directory(u"again", 1, 1);  // its own child
    EXPECT_EQ(message(loop.Bytes()), "Qt resource archive: the tree loops");

    ArchiveWriter zstd(3);
    zstd.Directory(u"", 1, 1);
    zstd.File(u"a.webp", "zz", 4);
    EXPECT_EQ(message(zstd.Bytes()), "Qt resource archive: a.webp is zstd-compressed, which this reader does not support");

    ArchiveWriter escape(3);
    escape.Directory(u"", 1, 1);
    escape.File(u"..", "x");
    EXPECT_EQ(message(escape.Bytes()), "Qt resource archive holds an unsafe file name");

    EXPECT_THROW(ReadQresFile("/nonexistent/archive.rcc"), std::runtime_error);
}
