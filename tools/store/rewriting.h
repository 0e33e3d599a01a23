// Writing what an object has anew, with some more, so that nothing of it is lost.
#ifndef MAVOEA_TOOLS_STORE_REWRITING_H_
#define MAVOEA_TOOLS_STORE_REWRITING_H_

#include <functional>
#include <string>
#include <vector>

#include "tools/place/volume.h"
#include "tools/store/metadata.h"
#include "tools/store/writer.h"

namespace mavoea::tool {

// Failure where some of what has been read of the object could not be, or would not be written
// again.
void RequireRewritable(const Object& object, const Metadata& there);

struct Fitting {
    Metadata metadata;
    std::vector<Missing> missing;  // what of that which is new has no place
};

// What of `wanted`, all that the object has and some more, its volume has a place for. Failure
// where anything else than items of those names, which are new, would be lost.
Fitting FitAll(const Object& object, Metadata wanted, const std::vector<std::string>& added);

// How what is added is called.
std::vector<std::string> NamesOfItems(const Metadata& added);

// Writes it and keeps what is not written anew. Returns what is not there when it is read back, in
// a dry run what could not be written.
std::vector<Missing> Rewrite(const Object& object, const Metadata& fitting,
                             const WriteOptions& options,
                             const std::function<Metadata()>& read_back);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_STORE_REWRITING_H_
