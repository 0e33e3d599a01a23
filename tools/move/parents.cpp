#include "tools/move/parents.h"

#include "tools/place/volume.h"

namespace mavoea::tool {

Place Parents::Make(Transfer* transfer, const std::string& source, const DirectoryRef& below) {
    parents_.clear();
    DirectoryRef at = below;
    std::size_t begin = source.find_first_not_of('/');
    if (begin == std::string::npos) return {below, "."};
    for (;;) {
        const std::size_t end = source.find('/', begin);
        const std::size_t next = source.find_first_not_of('/', end);
        const std::string name = source.substr(begin, end - begin);
        Place to = {at, name};
        if (end == std::string::npos || next == std::string::npos) return to;
        begin = next;
        if (name == ".") continue;
        const Place from = PlaceOf(source.substr(0, end + 1), Shown::kAsGiven);
        const bool is_new = !to.Status();
        at = transfer->MakeDirectory(from, to);
        parents_.push_back({from, to, at, is_new});
    }
}

void Parents::Finish(Transfer* transfer) {
    while (!parents_.empty()) {
        const Parent parent = parents_.back();
        parents_.pop_back();
        transfer->FinishDirectory(parent.from, *parent.from.Open(), parent.to, parent.made,
                                  parent.is_new);
    }
}

}  // namespace mavoea::tool
