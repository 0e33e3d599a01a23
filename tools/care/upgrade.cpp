#include "tools/care/upgrade.h"

#include "tools/say/text.h"
#include "tools/store/adoption.h"
#include "tools/transfer/pending.h"

namespace mavoea::tool {

void RequireEaDirectory(const Object& object) {
    if (object.keeping() == Keeping::kNone) throw NoStore(object);
    if (object.keeping() != Keeping::kEaDirectory) {
        throw Failure(kFailed, object.path(),
                      "volumes of type " + TypeId(object.type) + ", " +
                          std::string(TypeName(object.type)) + ", keep no EA directory",
                      "there is nothing to do there");
    }
    RequireParent(object);
}

ExitStatus Upgrade(const TreeOptions& options) {
    const auto work = [](const Object& object, Notes* notes) {
        const Adoption adoption = Adopt(object);
        for (const std::string& note : adoption.notes) {
            notes->push_back(Printable(object.path()) + ": " + note);
        }
        if (!adoption.adopted.empty()) return Outcome::kDone;
        return adoption.current ? Outcome::kCurrent : Outcome::kNothing;
    };
    return RunOnTree(
        options, {.doing = "upgrading",
                  .done = "converted",
                  .current = "already current",
                  .nothing = "with nothing to convert",
                  .check = RequireEaDirectory,
                  .work = work,
                  .on_named = SettleNamed,
                  .on_directory = [](const DirectoryRef& inside) { (void)SettlePending(inside); }});
}

}  // namespace mavoea::tool
