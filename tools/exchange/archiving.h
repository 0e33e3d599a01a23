// The same files as they are written.
#ifndef MAVOEA_TOOLS_EXCHANGE_ARCHIVING_H_
#define MAVOEA_TOOLS_EXCHANGE_ARCHIVING_H_

#include <functional>
#include <vector>

#include "tools/exchange/archive.h"

namespace mavoea::tool {

// What is put into a file: all of it has a place there. But for AppleDouble it has data.
//
// What the format has no place for goes from `archive` to `missing`, the name too, which is made
// one that can stand there. Throws Failure where a fork is larger than any file of the format.
void FitArchive(Archive* archive, std::vector<Missing>* missing);

// Puts out the file, from front to back. `archive` fits. Throws Failure.
void WriteArchive(const Archive& archive, const std::function<void(ByteView)>& put);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_EXCHANGE_ARCHIVING_H_
