#include "tools/cli/opening.h"

#include "tools/say/output.h"
#include "tools/store/adoption.h"
#include "tools/transfer/pending.h"

namespace mavoea::tool {

std::unique_ptr<Changer> OpenToChange(const Object& object) {
    SettleNamed(object);
    auto changer = OpenChanger(object);
    std::vector<std::string> notes;
    AdoptForChange(object, &notes);
    for (const std::string& note : notes) Note(note);
    return changer;
}

}  // namespace mavoea::tool
