#include "tools/store/gathering.h"

#include <algorithm>

#include "tools/say/text.h"

namespace mavoea::tool {
namespace {

bool Differs(const Content& one, const Content& other) {
    if (one.damaged() || other.damaged()) return true;
    return one.size() != other.size() || FirstDifference(one, other).has_value();
}

bool Speaks(EntryId id, const Content& value) {
    const Bytes bytes = value.All();
    return id == EntryId::kAfpFileInfo ? !IsAllZero(bytes) : SaysSomething(id, bytes);
}

std::string OtherThanIn(const std::string& holder, const std::string& spelling) {
    return "it is another one than in " + WhereText(holder, spelling);
}

}  // namespace

std::string WhereText(const std::string& holder, const std::string& spelling) {
    return Printable(holder) + (spelling.empty() ? "" : " (" + Printable(spelling) + ')');
}

void Gathering::AddFinderInfo(Content value, const Origin& origin) {
    if (!value.damaged() && IsAllZero(value.All())) return;
    Take(&metadata_.finder_info, "Finder info", std::move(value), origin);
}

void Gathering::AddFork(Content value, const Origin& origin) {
    auto& known = metadata_.fork;
    if (value.size() == 0 || (known && IsBlankFork(value))) return;
    if (known && IsBlankFork(known->value)) known.reset();
    Take(&known, "resource fork", std::move(value), origin);
}

void Gathering::AddEntry(EntryId id, Content value, const Origin& origin) {
    if (!value.damaged() && !Speaks(id, value)) return;
    std::optional<Metadata::Item> item;
    if (const auto other = metadata_.entries.find(id); other != metadata_.entries.end()) {
        item = other->second;
        const bool whole = !value.damaged() && !item->value.damaged();
        if (whole && id == EntryId::kFileDates) {
            if (auto dates = JoinedDates(item->value.All(), value.All())) {
                other->second.value = Content(*std::move(dates));
                return;
            }
        }
    }
    Take(&item, NameOfEntry(id), std::move(value), origin);
    metadata_.entries.insert_or_assign(id, *std::move(item));
}

void Gathering::AddAttribute(Metadata::Attribute attribute) {
    auto& all = metadata_.attributes;
    const auto other = std::find_if(all.begin(), all.end(), [&](const Metadata::Attribute& one) {
        return one.name == attribute.name;
    });
    if (other == all.end()) {
        all.push_back(std::move(attribute));
    } else if (other->holder == attribute.holder && other->spelling == attribute.spelling) {
        *other = std::move(attribute);
    } else if (Differs(other->value, attribute.value)) {
        AddStray("a second " + NameOfAttribute(attribute.name),
                 OtherThanIn(other->holder, other->spelling),
                 {attribute.holder, attribute.spelling});
        metadata_.strays.back().attribute = true;
        metadata_.strays.back().second = true;
    }
}

void Gathering::AddStray(const std::string& item, const std::string& reason, const Origin& origin) {
    metadata_.strays.push_back(
        {item + " in " + WhereText(origin.holder, origin.spelling), reason, origin.holder});
}

void Gathering::Take(std::optional<Metadata::Item>* item, const std::string& name, Content value,
                     const Origin& origin) {
    if (!*item) {
        *item = Metadata::Item{std::move(value), origin.holder, origin.spelling};
    } else if (Differs((*item)->value, value)) {
        AddStray("a second " + name, OtherThanIn((*item)->holder, (*item)->spelling), origin);
        metadata_.strays.back().second = true;
    }
}

}  // namespace mavoea::tool
