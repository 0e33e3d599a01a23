// Reading AppleDouble files and netatalk's records into what is known of an object.
#ifndef MAVOEA_TOOLS_STORE_APPLE_DOUBLE_READER_H_
#define MAVOEA_TOOLS_STORE_APPLE_DOUBLE_READER_H_

#include <memory>
#include <string>

#include "tools/store/gathering.h"
#include "tools/store/metadata.h"
#include "tools/store/sidecars.h"

namespace mavoea::tool {

// What is damaged is among the problems.
void ReadFile(std::shared_ptr<const File> file, Metadata* metadata);

// Reads the file that was found, if it is still there; null when not, or when it is none.
// One that is small is read at once.
WholeFile ReadFound(const Sidecars::Found& found, Metadata* metadata);

// A record of an object's attribute. Throws Failure when it is damaged.
void ReadRecord(const Bytes& block, const Origin& origin, Metadata* metadata);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_STORE_APPLE_DOUBLE_READER_H_
