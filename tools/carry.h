// The metadata of an object whose data is, or will be, somewhere else.
#ifndef MAVOEA_TOOLS_CARRY_H_
#define MAVOEA_TOOLS_CARRY_H_

#include <string>

#include "tools/volume.h"

namespace mavoea::tool {

// Whether the volume holds any for the object, beside it or in its attributes.
bool HasMetadata(const Object& object);

// Whether any lies beside the object.
bool HasSidecar(const Object& object);

// Failure when the metadata of `from`, which has some, cannot have a place at `to`: the volume
// keeps none, or the name is too long.
void RequirePlace(const Object& from, const Object& to);

// Copies it, and looks whether it has arrived: names and sizes of the attributes, the files of the
// legacy folder, the locked state. The indexes are told. Data is at both places already. Throws
// Failure.
void CopyMetadata(const Object& from, const Object& to);

// Moves it to the new name of an object on volumes of one kind. The indexes are told. Throws
// Failure.
void RenameMetadata(const Object& from, const Object& to);

// Tell the indexes of an object that has no metadata, and that nobody should open.
void ReportNew(const std::string& path);
void ReportRenamed(const std::string& from, const std::string& to);

enum class IndexReport { kNo, kYes };

// Removes what lies beside an object that has gone, or gets other contents; the indexes are told of
// the first. Throws Failure.
void RemoveMetadata(const Object& object, IndexReport report);

// Removes the named attributes and the record that are in the inode itself. Throws Failure.
void RemoveInodeMetadata(const Object& object);

// Whether the object's attributes travel as its metadata, and not with its mode and owner.
bool TravelsAsMetadata(const std::string& attribute, const Object& from, const Object& to);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_CARRY_H_
