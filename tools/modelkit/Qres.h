#pragma once

// Reader of Qt binary resource files ("qres" archives, as written by the rcc
// tool), enough to take out the photographs some Debian data packages keep
// inside them.
//
// Layout, all integers big-endian:
//   header   "qres", version (1..3), tree offset, data offset, names offset,
//            and from version 3 a word of overall flags;
//   tree     entries of 14 bytes (version 1) or 22 bytes (version 2 and
//            later, which append a 64-bit modification time): name offset
//            (4), flags (2), then for a directory its child count (4) and
//            the index of its first child (4), for a file a country (2), a
//            language (2) and its data offset (4). Entry 0 is the root;
//   names    at each name offset: length in UTF-16 units (2), hash (4), the
//            UTF-16 units;
//   data     at each data offset: size (4), then the bytes. Flag 1 marks a
//            zlib-compressed file whose bytes start with its uncompressed
//            size (4); flag 4 marks a zstd-compressed file, which this reader
//            refuses by name.

#include <cstdint>
#include <string>
#include <vector>

namespace vora {
namespace modelkit {

struct QresFile {
    std::string path;  // '/'-separated, UTF-8, relative to the archive root
    std::string data;  // uncompressed bytes
};

// Every file of the archive, depth first in tree order. Throws
// std::runtime_error, naming what is wrong, for a malformed archive.
std::vector<QresFile> ReadQres(const std::string& bytes);

// Reads the archive at path; the message names the file on failure.
std::vector<QresFile> ReadQresFile(const std::string& path);

}  // namespace modelkit
}  // namespace vora
