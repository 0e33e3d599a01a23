// An object, and where its metadata lies beside it.
#ifndef MAVOEA_TESTS_SUPPORT_OBJECT_FILES_H_
#define MAVOEA_TESTS_SUPPORT_OBJECT_FILES_H_

#include <errno.h>
#include <stdlib.h>
#include <sys/stat.h>

#include <algorithm>
#include <filesystem>
#include <string>
#include <vector>

#include "tests/support/temp_dir.h"

namespace mavoea::test {

inline void MakeDir(const std::string& path, mode_t mode = 0777) {
    if (::mkdir(path.c_str(), mode) != 0 && errno != EEXIST) abort();
}

struct ObjectFiles {
    std::string parent;
    std::string name;

    std::string object() const { return parent + "/" + name; }
    std::string sidecar() const { return parent + "/._" + name; }
    std::string ea_dir() const { return parent + "/@eaDir"; }
    std::string folder() const { return ea_dir() + "/" + name; }
    // These two of a name that is not shortened, of up to 242 bytes.
    std::string stream() const { return ea_dir() + "/" + name + "@MavoEAStream"; }
    std::string resource() const { return ea_dir() + "/" + name + "@MavoResource"; }

    void MakeObject() const { WriteFile(object(), Ascii("data of " + name)); }
    void MakeSidecar() const { WriteFile(sidecar(), Ascii("sidecar of " + name)); }
    void MakeStream() const {
        MakeDir(ea_dir());
        WriteFile(stream(), Ascii("stream of " + name));
    }
    void MakeResource() const {
        MakeDir(ea_dir());
        WriteFile(resource(), Ascii("resource of " + name));
    }
    // A file in the legacy folder; its value is its name and the object's.
    void MakeLegacy(const std::string& kind) const {
        MakeFolder();
        WriteFile(folder() + "/" + kind, Ascii(kind + " of " + name));
    }
    void MakeFolder() const {
        MakeDir(ea_dir());
        MakeDir(folder());
    }
    // Metadata in every place and form.
    void MakeAll() const {
        MakeSidecar();
        MakeStream();
        MakeResource();
        MakeLegacy("MAVO:Resource");
        MakeLegacy("color");
    }
};

// Everything below `directory`, sorted: "@eaDir/", "@eaDir/a@MavoEAStream", "a". What symbolic
// links lead to is left out.
inline std::vector<std::string> Tree(const std::string& directory) {
    std::vector<std::string> all;
    for (const auto& entry : std::filesystem::recursive_directory_iterator(directory)) {
        const bool is_directory = entry.is_directory() && !entry.is_symlink();
        all.push_back(entry.path().string().substr(directory.size() + 1) +
                      (is_directory ? "/" : ""));
    }
    std::sort(all.begin(), all.end());
    return all;
}

// Names that trip up whoever takes them for something else.
inline std::vector<std::string> OddNames() {
    return {"two words",  " ",
            "it's",       "\"quoted\"",
            "two\nlines", "na\xC3\xAFve",
            "\xFF\xFE",   "-rf",
            "*",          "$(exit 1)",
            "%s%n%m",     "a@b",
            ".hidden",    "a@MavoEAStream",
            "back\\slash"};
}

}  // namespace mavoea::test

#endif  // MAVOEA_TESTS_SUPPORT_OBJECT_FILES_H_
