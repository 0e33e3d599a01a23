// AppleDouble files put together from what they are to hold, piece by piece: nothing large is held
// in memory.
#ifndef MAVOEA_TOOLS_STORE_ENCODING_H_
#define MAVOEA_TOOLS_STORE_ENCODING_H_

#include <vector>

#include "tools/store/metadata.h"

namespace mavoea::tool {

// The pieces of a file, one behind the other.
using Pieces = std::vector<Content>;

// The three layouts; docs/formats.md shows them. What is in `metadata` fits; what a layout has no
// place for is left out.

// Finder info, attributes and fork. Throws Failure.
Pieces EncodeStream(const Metadata& metadata);

// Finder info and fork.
Pieces EncodePlain(const Metadata& metadata);

// The head with all entries that it has a place for, and the fork.
Pieces EncodeWithHead(const Metadata& metadata);

// A "._" file: what FitAppleDouble() has left of it, in the layout that has a place for that; none
// where there is nothing.
Pieces EncodeAppleDouble(const Metadata& metadata);

// The record of an object, as an attribute.
Bytes EncodeRecordBlock(const Metadata& metadata);

// The most bytes that an entry may have in the head, and in the record; 0 where it has no place.
std::uint32_t RoomInHead(EntryId id);
std::uint32_t RoomInRecord(EntryId id);

// What is too much for a stream, or has no name that could stand in one, goes from `metadata` to
// `missing`.
void FitStream(Metadata* metadata, std::vector<Missing>* missing);

// The same of what a "._" file has no place for; services' files are left alone. One that says all
// that there is to say goes as it is.
void FitAppleDouble(Metadata* metadata, std::vector<Missing>* missing);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_STORE_ENCODING_H_
