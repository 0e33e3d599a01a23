// Writing a damaged metadata file anew, where all that it holds can still be read.
#ifndef MAVOEA_TOOLS_CARE_WHOLE_FILE_H_
#define MAVOEA_TOOLS_CARE_WHOLE_FILE_H_

#include <memory>
#include <optional>
#include <string>

#include "tools/care/kept.h"
#include "tools/store/layout.h"
#include "tools/store/metadata.h"

namespace mavoea::tool {

// What keeps something in the file from being read for certain: a part of it is missing, hidden by
// another, or has bytes that another claims too. None where each byte of each part is there, once,
// and all others are zeros.
std::optional<std::string> WhyNotWhole(const Layout& layout, const File& file);

// All that such a file holds. Failure for one that is not whole.
Metadata ReadWhole(const std::shared_ptr<const File>& file);

// "\"colour\"; 60 of 100 bytes of the resource fork", of a file that need not be whole; empty when
// nothing can be read. Throws Failure.
std::string WhatCanBeRead(const std::shared_ptr<const File>& file);

// A metadata file of an object.
struct FileOfObject {
    Place file;
    KeptOf which;
};

// Opens it to be changed, locked against others until it is closed. Null when it has gone. Failure
// for one that is in use, or has other names, or RequireShared(): somebody may have led here what
// is none of the object's.
std::shared_ptr<const File> OpenOwn(const Object& object, const Place& file);

// Failure for a file of a third user's, who has kept it from others: that it lies under a name of
// the object's does not give it to the object's owner.
void RequireShared(const Inode& object, const File& file);

// Why a program would not read a file; none: it would.
using WhyIgnored = std::optional<std::string> (*)(const Layout&);

// Writes it anew with all that it holds, reads that back, and puts it in the place of the old one,
// whose bytes are kept. Returns the path where they are. Failure, and nothing has changed, where
// something of it would not arrive, or the new one would be ignored as well; `why_ignored` is null
// where that does not matter.
std::string WriteAnew(const Object& object, const FileOfObject& own, WhyIgnored why_ignored);

// Writes an EA stream anew with these attributes besides all that it holds; of the same names the
// new ones count. Failure, and nothing has changed, where something of it would not arrive.
void AddToStream(const Object& object, const Place& stream, const Metadata& more);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_CARE_WHOLE_FILE_H_
