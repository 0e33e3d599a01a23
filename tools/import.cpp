#include "tools/import.h"

#include <iostream>
#include <memory>

#include "format/ea_stream.h"
#include "tools/contents.h"
#include "tools/file.h"
#include "tools/output.h"
#include "tools/store.h"
#include "tools/text.h"

namespace mavoea::tool {
namespace {

Contents ReadFile(const std::string& path) {
    const File file = File::OpenToRead(path);
    return ReadContents(file, ReadLayout(file));
}

// Finder info and fork have entries of their own; as attributes they count where those are empty.
// The locked state is no metadata that a "._" file could bring.
void SortOutNames(Contents* contents) {
    std::erase_if(contents->attributes, [&](Contents::Attribute& attribute) {
        switch (KindOf(attribute.name)) {
            case Kind::kAttribute:
                return false;
            case Kind::kFinderInfo:
                if (!contents->finder_info && attribute.value.size() == kFinderInfoSize) {
                    contents->finder_info = std::move(attribute.value);
                    return true;
                }
                break;
            case Kind::kResourceFork:
                if (!contents->fork && !attribute.value.empty()) {
                    contents->fork = std::move(attribute.value);
                    return true;
                }
                break;
            case Kind::kLocked:
                break;
        }
        contents->others.push_back("attribute \"" + Printable(attribute.name) + "\"");
        return true;
    });
}

std::string Joined(const std::vector<std::string>& words) {
    std::string text;
    for (const std::string& word : words) text += (text.empty() ? "" : ", ") + word;
    return text;
}

class ObjectImport {
 public:
    ObjectImport(Store* store, std::string path) : store_(store), path_(std::move(path)) {}

    void Run(const Contents& contents) {
        for (const Contents::Attribute& attribute : contents.attributes) {
            Set(attribute.name, attribute.value);
        }
        if (contents.finder_info) Set(std::string(kFinderInfoName), *contents.finder_info);
        if (contents.fork) Set(std::string(kResourceForkName), *contents.fork);
    }

    ExitStatus status() const { return status_; }
    const std::vector<std::string>& failures() const { return failures_; }

 private:
    void Set(const std::string& name, const Bytes& value) {
        try {
            // What is there already need not be written, and is not when it cannot be.
            if (store_->Get(name) != value) store_->Set(name, value);
        } catch (const Failure& failure) {
            failures_.push_back(Printable(path_) + ": \"" + Printable(name) +
                                "\" was not taken over: " + failure.what());
            status_ = std::max(status_, failure.status());
        }
    }

    Store* store_;
    std::string path_;
    std::vector<std::string> failures_;
    ExitStatus status_ = kSuccess;
};

void PrintText(const std::string& path, const Contents& contents) {
    std::vector<std::string> words;
    if (const std::size_t count = contents.attributes.size(); count > 0) {
        words.push_back(std::to_string(count) + (count == 1 ? " attribute" : " attributes"));
    }
    if (contents.finder_info) words.emplace_back("Finder info");
    if (contents.fork) {
        words.push_back("resource fork of " + std::to_string(contents.fork->size()) + " bytes");
    }
    if (words.empty()) words.emplace_back("nothing to take over");
    std::cout << Printable(path) << ": " << Joined(words) << '\n';
}

Json ImportJson(const std::string& source, const std::string& path, const Contents& contents,
                const std::vector<std::string>& failures) {
    Json json;
    json.SetText("path", path);
    json.SetText("appleDouble", source);
    Json attributes = Json::Array();
    for (const Contents::Attribute& attribute : contents.attributes) {
        Json entry;
        entry.SetText("name", attribute.name);
        entry.Set("size", attribute.value.size());
        attributes.Add(std::move(entry));
    }
    json.Set("attributes", std::move(attributes));
    json.Set("finderInfo", contents.finder_info.has_value());
    json.Set("resourceFork", contents.fork ? contents.fork->size() : 0);
    Json others = Json::Array();
    for (const std::string& other : contents.others) {
        Json entry;
        entry.SetText("name", other);
        others.Add(std::move(entry));
    }
    json.Set("notTakenOver", std::move(others));
    SetMessages(json, "failures", failures);
    return json;
}

}  // namespace

ExitStatus Import(const std::string& apple_double, const std::string& path, bool json) {
    const Object object = FindObject(path);
    const std::unique_ptr<Store> store = OpenStore(object);
    Contents contents = ReadFile(apple_double);
    SortOutNames(&contents);

    ObjectImport import(store.get(), path);
    import.Run(contents);
    if (json) {
        Print(ImportJson(apple_double, object.path, contents, import.failures()));
    } else if (import.failures().empty()) {
        PrintText(path, contents);
    }
    if (!json && !contents.others.empty()) {
        Note(Printable(apple_double) + ": not taken over: " + Joined(contents.others));
    }
    // An object's own "._" file, on a volume that would not have it there.
    if (!Exists(apple_double)) {
        Note(Printable(apple_double) + ": it has become the object's EA stream");
    }
    for (const std::string& failure : import.failures()) Report(failure);
    return import.status();
}

}  // namespace mavoea::tool
