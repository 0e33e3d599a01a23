// mavoea list and mavoea get: what an object has, wherever it lies. Nothing changes by it.
#ifndef MAVOEA_TOOLS_SHOW_ATTRIBUTES_H_
#define MAVOEA_TOOLS_SHOW_ATTRIBUTES_H_

#include <functional>
#include <string>
#include <vector>

#include "tools/place/volume.h"
#include "tools/say/json.h"
#include "tools/say/messages.h"
#include "tools/store/metadata.h"
#include "tools/walk/tree.h"

namespace mavoea::tool {

// Hands out what each object has; "listing", for those who ask how far it is. What cannot be looked
// at is told, and is a failure; `look` may throw one, too. Returns the gravest status.
// `separate` puts an empty line before all but the first that calls it. The work is shared out to
// processes: what `look` changes does not count.
using Look = std::function<void(const Object&, const std::string& shown, const Metadata&,
                                const std::function<void()>& separate)>;
ExitStatus LookAtObjects(const char* doing, const TreeOptions& options, const Look& look);

// What an object has twice, where other programs may have kept it, told and as "strays".
void TellStrays(const Object& object, const Metadata& metadata);
void SetStrays(const Object& object, const Metadata& metadata, Json* entry);

struct ListOptions {
    TreeOptions tree;
    bool details = false;
    bool null = false;    // the path and the name of each attribute, a NUL behind either
    bool values = false;  // in JSON, as base64
};

// JSON is a line for each object. In recursive work, text leaves out objects that have nothing.
// What cannot be looked at is told, and is a failure.
ExitStatus List(const ListOptions& options);

// `kPlain`: as it is, but nothing that a terminal would take for more than text goes to one.
enum class Format { kPlain, kRaw, kHexDump, kJson };

ExitStatus Get(const std::string& path, const std::string& name, Format format);

// As list has them; what cannot be read has none.
std::vector<std::string> AttributeNames(const std::string& path);

// What there is to say of an attribute that an object does not have.
Failure NoAttribute(const std::string& path, const std::string& name);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_SHOW_ATTRIBUTES_H_
