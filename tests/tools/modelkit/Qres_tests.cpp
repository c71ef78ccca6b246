#include "modelkit/Qres.h"

#include <stdexcept>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <zlib.h>

using namespace vora::modelkit;

namespace {

std::string Be(size_t value, int bytes) {
    std::string out;
    while (bytes--) out.push_back(static_cast<char>(value >> (8 * bytes)));
    return out;
}

// Builds an archive from the layout: header, data, names, tree. Entries come
// in tree order; the children of a directory are consecutive.
struct Archive {
    explicit Archive(int v) : version(v) {}
    int version;
    std::string data, names, tree;

    Archive& Node(const std::u16string& name, uint16_t flags, uint32_t a, uint32_t b) {
        tree += Be(names.size(), 4) + Be(flags, 2) + Be(a, 4) + Be(b, 4) + std::string(version >= 2 ? 8 : 0, '\x11');
        names += Be(name.size(), 2) + Be(0x12345678, 4);  // the hash is not used for reading
        for (char16_t unit : name) names += Be(unit, 2);
        return *this;
    }
    Archive& Dir(const std::u16string& name, uint32_t children, uint32_t first) { return Node(name, 2, children, first); }
    Archive& File(const std::u16string& name, std::string content, uint16_t flags = 0) {
        if (flags & 1) {  // zlib, after the unpacked size
            uLongf size = compressBound(content.size());
            std::string packed(size, '\0');
            compress(reinterpret_cast<Bytef*>(&packed[0]), &size, reinterpret_cast<const Bytef*>(content.data()), content.size());
            content = Be(content.size(), 4) + packed.substr(0, size);
        }
        const size_t offset = data.size();
        data += Be(content.size(), 4) + content;
        return Node(name, flags, 1, static_cast<uint32_t>(offset));  // country 0, language 1
    }
    std::string Bytes() const {
        const size_t header = version >= 3 ? 24 : 20, namesAt = header + data.size();
        return "qres" + Be(version, 4) + Be(namesAt + names.size(), 4) + Be(header, 4) + Be(namesAt, 4) +
               Be(0, version >= 3 ? 4 : 0) + data + names + tree;
    }
};

Archive Sample(int version) {
    return Archive(version)
        .Dir(u"", 2, 1)                                                          // 0: root
        .Dir(u"photos", 2, 3)                                                    // 1
        .File(u"readme.txt", "plain bytes")                                      // 2
        .File(u"caf\u00e9 \U0001F600.webp", std::string(5000, 'x') + "tail", 1)  // 3
        .File(u"empty", "");                                                     // 4
}

}  // namespace

TEST(Qres, ReadsEveryVersionWithPathsAndCompressedData) {
    const std::vector<std::pair<std::string, std::string>> expected = {
        {"photos/caf\xc3\xa9 \xf0\x9f\x98\x80.webp", std::string(5000, 'x') + "tail"},
        {"photos/empty", ""},
        {"readme.txt", "plain bytes"}};
    for (int version : {1, 2, 3}) {
        std::vector<std::pair<std::string, std::string>> files;
        for (const QresFile& file : ReadQres(Sample(version).Bytes())) files.emplace_back(file.path, file.data);
        EXPECT_EQ(files, expected) << "version " << version;
    }
}

TEST(Qres, RefusesMalformedArchivesInWords) {
    const std::string good = Sample(3).Bytes(), truncated = "Qt resource archive is truncated or corrupt";
    std::string future = good;
    future[7] = 9;
    const std::vector<std::pair<std::string, std::string>> cases = {
        {"PK\x03\x04" + good.substr(4), "not a Qt resource archive (no 'qres' header)"},
        {future, "unsupported Qt resource archive version 9"},
        {good.substr(0, 30), truncated},
        {good.substr(0, good.size() - 1), truncated},
        {good.substr(0, good.size() - 30), truncated},
        {Archive(2).Dir(u"", 1, 1).Dir(u"again", 1, 1).Bytes(), "Qt resource archive: the tree loops"},
        {Archive(3).Dir(u"", 1, 1).File(u"a.webp", "zz", 4).Bytes(),
         "Qt resource archive: a.webp is zstd-compressed, which this reader does not support"},
        {Archive(3).Dir(u"", 1, 1).File(u"..", "x").Bytes(), "Qt resource archive holds an unsafe file name"}};
    for (const auto& c : cases)
        EXPECT_THAT([&] { ReadQres(c.first); }, testing::ThrowsMessage<std::runtime_error>(testing::StrEq(c.second)));
    EXPECT_THROW(ReadQresFile("/nonexistent/archive.rcc"), std::runtime_error);
}
