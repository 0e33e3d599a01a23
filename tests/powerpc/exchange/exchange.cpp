// Metadata that one build of the library writes for another to read:
//
//   exchange write DIR    makes volumes of every type in DIR, with objects and their metadata
//   exchange change DIR   changes what is there
//   exchange read DIR     prints, through the library, all that it finds
//   exchange list DIR     prints names, modes, sizes and extended attributes, without the library
//
// Clock and umask are fixed, so that what is written depends on nothing but the library.

#include <errno.h>
#include <fcntl.h>
#include <stdlib.h>
#include <string.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <cstdint>
#include <cstdio>
#include <filesystem>
#include <functional>
#include <map>
#include <string>
#include <vector>

#include "include/mavoea.h"
#include "platform/include/mavocore.h"
#include "tests/support/mac_files.h"
#include "tests/support/record_builder.h"
#include "tests/support/stream_builder.h"
#include "tests/support/temp_dir.h"

// The library's clock as well: a program's functions go before those of its libraries.
time_t time(time_t* result) noexcept {
    constexpr time_t kNow = 0x2F45B617;
    if (result != nullptr) *result = kNow;
    return kNow;
}

namespace mavoea::test {
namespace {

constexpr int kStatusSkipped = 77;

const std::string& LongName() {  // too long for the metadata files' names, which shorten it
    static const std::string name = std::string(245, 'n') + ".text";
    return name;
}

bool failed = false;

// Says what went wrong; the program goes on, and fails at its end.
void Check(bool succeeded, const std::string& what) {
    if (succeeded) return;
    failed = true;
    fprintf(stderr, "failed: %s: code 0x%X in %s line %d, %s\n", what.c_str(),
            static_cast<unsigned>(MLIBCErrGet()), MLIBCErrorGetFile(), MLIBCErrorGetLine(),
            strerror(errno));
}

// Volumes of each kind, in the directory given to the program.
struct Volumes {
    explicit Volumes(const std::string& dir)
        : apple_double(Declare(dir + "/appledouble", 0)),
          ea_directory(Declare(dir + "/eadir", 1)),
          file_ea(Declare(dir + "/fileea", 2)),
          xattr(Declare(dir + "/xattr", 7)) {}

    static std::string Declare(const std::string& path, int type) {
        Check(mkdir(path.c_str(), 0755) == 0 || errno == EEXIST, path);
        Check(MAVOVolumeDeclare(path.c_str(), type) == 0, "declare " + path);
        return path + "/";
    }

    std::string apple_double;
    std::string ea_directory;
    std::string file_ea;
    std::string xattr;
};

std::string MakeObject(const std::string& path) {
    WriteFile(path, Ascii("data of " + std::filesystem::path(path).filename().string()));
    return path;
}

void WithStream(const std::string& object, int place, int flags,
                const std::function<void(EASHandle*)>& work) {
    const int fd = MAVOEAOpen(EA_FORM_FILE, object.c_str(), MAVOEA_KIND_STREAM, flags, place);
    Check(fd >= 0, "open the stream of " + object);
    if (fd < 0) return;
    EASHandle* const stream = MAVOEASOpen(fd, (flags & O_ACCMODE) == O_RDONLY ? F_RDLCK : F_WRLCK);
    Check(stream != nullptr, "read the stream of " + object);
    if (stream != nullptr) {
        work(stream);
        Check(MAVOEASClose(stream) == 0, "close the stream of " + object);
    }
    close(fd);
}

void Put(EASHandle* stream, const std::string& name, const Bytes& value, unsigned offset = 0) {
    const auto size = static_cast<unsigned>(value.size());
    const int written =
        MAVOEASWrite(stream, name.c_str(), value.data(), size, offset, EAS_WRITE_OVERWRITE);
    Check(written == static_cast<int>(size), "write " + name);
}

// Copies the metadata of an object, by commands where no function is given.
void Copy(const std::string& from, std::string to,
          int (*copy)(const char* from, const char* to) = nullptr) {
    Check(MAVOEACopyEx(from.c_str(), to.data(), 0, 1, -1, -1, 1, 1, copy) == 0, "copy to " + to);
}

// ---- write --------------------------------------------------------------------------------------

void WriteStreams(const Volumes& on) {
    WithStream(MakeObject(on.ea_directory + "stream"), EA_PLACE_EADIR, O_RDWR | O_CREAT,
               [](EASHandle* stream) {
                   Put(stream, "colour", Ascii("blue"));
                   Put(stream, "empty", {});
                   Put(stream, "gap", Ascii("behind a gap"), 300);
                   Put(stream, "large", Pattern(70000, 3));
                   Put(stream, "short", Pattern(40, 5));
                   Put(stream, std::string(254, 'x'), Ascii("of a long name"));
                   Put(stream, "colour", Ascii("red"));
                   Check(MAVOEASRemove(stream, "gap") == 0, "remove gap");
                   Check(MAVOEASTruncate(stream, "short", 19) == 0, "truncate short");
                   Check(MAVOEASTruncate(stream, "empty", 5) == 0, "truncate empty");
               });
    // A fork is moved by what is written before it; Finder info lies in the header.
    const std::string object = MakeObject(on.ea_directory + LongName());
    WithStream(object, EA_PLACE_EADIR, O_RDWR | O_CREAT, [](EASHandle* stream) {
        Put(stream, "a", Pattern(1000, 7));
        const Bytes finder_info = Pattern(32, 0x50);
        memcpy(stream->header + kFinderInfoAt, finder_info.data(), finder_info.size());
        Check(EASWriteFinderInfo(stream) == 0, "write Finder info");
    });
    WithStream(MakeObject(on.apple_double + "stream"), EA_PLACE_APPLEDOUBLE, O_RDWR | O_CREAT,
               [](EASHandle* stream) {
                   for (int i = 0; i < 40; ++i) {
                       Put(stream, "name " + std::to_string(i),
                           Pattern(static_cast<std::size_t>(i) * 3, static_cast<std::uint8_t>(i)));
                   }
               });
}

// "._" files of a Mac: read in place, taken for the stream, repaired, and copied.
void WriteMacFiles(const Volumes& on) {
    const MacContents contents = {
        .attributes = {{"com.apple.quarantine", Pattern(57, 1)}, {"note", Ascii("from a Mac")}},
        .finder_info = Pattern(32, 0x20),
        .fork = Pattern(5000, 9)};
    const MacFile sidecar = MacSidecar(contents);
    for (const char* name : {"mac", "copied", "copied in process"}) {
        MakeObject(on.apple_double + name);
        WriteFile(on.apple_double + "._" + name, sidecar.bytes);
    }
    WithStream(on.apple_double + "mac", EA_PLACE_APPLEDOUBLE, O_RDWR,
               [](EASHandle* stream) { Put(stream, "added", Pattern(6000, 2)); });

    const std::string imported = MakeObject(on.ea_directory + "imported");
    WriteFile(on.ea_directory + "._imported", sidecar.bytes);
    Check(MAVOEAUpgrade(imported.c_str(), MAVOEA_KIND_STREAM) == 0, "import");
    WithStream(imported, EA_PLACE_EADIR, O_RDWR, [](EASHandle* stream) {
        Put(stream, "note", Pattern(9000, 11));  // The fork makes room.
    });

    const std::string repaired = MakeObject(on.ea_directory + "repaired");
    WriteFile(on.ea_directory + "@eaDir/repaired@MavoResource", sidecar.bytes);
    Check(MAVOEAFixErrorAD(repaired.c_str()) == 0, "repair");

    for (const std::string& to : {on.ea_directory, on.file_ea}) {
        Copy(on.apple_double + "copied", MakeObject(to + "copied"));
    }
    const std::string in_process = MakeObject(on.ea_directory + "copied in process");
    Copy(on.apple_double + "copied in process", in_process, [](const char* from, const char* to) {
        WriteFile(to, ReadFile(from));
        return 0;
    });
    Copy(imported, MakeObject(on.apple_double + "copied back"));
}

void WriteRecords(const Volumes& on) {
    const Bytes record = AttributeRecord();
    const auto size = static_cast<int>(record.size());
    for (const char* name : {"record", "synced"}) {
        const std::string object = MakeObject(on.file_ea + name);
        Check(MAVOEAFileEAAdoubleFlush(record.data(), size, object.c_str()) == 0, object);
    }
    const std::string synced = on.file_ea + "synced";
    Check(MAVOEAEADirFSFInfoWrite(synced.c_str(), Pattern(32, 0x60).data()) == 0, "Finder info");
    Check(MAVOEAFileEAFSFinfoEASync(synced.c_str(), 1) == 0, "sync");

    const std::string object = MakeObject(on.ea_directory + "record");
    Bytes head = NetatalkFile(Pattern(32, 0x70), {}).bytes;
    head.resize(kNetatalkHead);
    Check(MAVOEAEADirAdoubleFlush(head.data(), static_cast<int>(head.size()), object.c_str()) == 0,
          object);
    Check(MAVOEAFileEAWriteFlushTime((on.file_ea + "record").c_str(), 0) == 0, "flush time");
}

void WriteLegacyFolder(const Volumes& on) {
    const std::string object = MakeObject(on.ea_directory + "legacy");
    const std::string folder = on.ea_directory + "@eaDir/legacy/";
    std::filesystem::create_directory(folder);
    for (const auto& [name, value] : std::map<std::string, Bytes>{
             {"one", Ascii("1")}, {"two", Pattern(3000, 4)}, {"none", {}}}) {
        WriteFile(folder + name, value);
    }
    WriteFile(folder + "MAVO:Resource", NetatalkFile(Pattern(32, 0x30), Pattern(99, 8)).bytes);
    Check(MAVOEAUpgrade(object.c_str(), MAVOEA_KIND_STREAM) == 0, "upgrade stream");
    Check(MAVOEAUpgrade(object.c_str(), MAVOEA_KIND_RESOURCE) == 0, "upgrade resource file");
}

void WriteAttributes(const Volumes& on) {
    const std::string object = MakeObject(on.xattr + "attributes");
    Check(MAVOEAXattrSet(object.c_str(), "user.comment", "a comment", 9, 0) == 0, "set comment");
    Check(MAVOEAXattrSet(object.c_str(), "user.empty", "", 0, 0) == 0, "set empty");
    Check(EASetSmbArchive(object.c_str()) == 0, "archive bit");
}

void Write(const std::string& dir) {
    const Volumes on(dir);
    WriteStreams(on);
    WriteMacFiles(on);
    WriteRecords(on);
    WriteLegacyFolder(on);
    WriteAttributes(on);
}

// ---- change -------------------------------------------------------------------------------------

void Change(const std::string& dir) {
    const Volumes on(dir);
    WithStream(on.ea_directory + "stream", EA_PLACE_EADIR, O_RDWR, [](EASHandle* stream) {
        Check(MAVOEASRemove(stream, "large") == 0, "remove large");
        Put(stream, "later", Pattern(500, 13));
        Put(stream, "colour", Ascii("green"), 1);
    });
    WithStream(on.ea_directory + "imported", EA_PLACE_EADIR, O_RDWR, [](EASHandle* stream) {
        Check(MAVOEASRemove(stream, "com.apple.quarantine") == 0, "remove quarantine");
        Put(stream, "wider", Pattern(4321, 17));
    });
    WithStream(on.apple_double + "mac", EA_PLACE_APPLEDOUBLE, O_RDWR,
               [](EASHandle* stream) { Check(MAVOEASRemove(stream, "note") == 0, "remove note"); });

    const std::string moved = on.ea_directory + "moved";
    Check(rename((on.ea_directory + LongName()).c_str(), moved.c_str()) == 0, "rename");
    Check(MAVOEARename((on.ea_directory + LongName()).c_str(), moved.c_str(), -1, nullptr) == 0,
          "rename metadata");
    const std::string removed = on.ea_directory + "legacy";
    Check(unlink(removed.c_str()) == 0, removed);
    Check(MAVOEARemove(removed.c_str(), -1, nullptr) == 0, "remove metadata");

    const std::string synced = on.file_ea + "synced";
    Check(MAVOEAEADirFSFInfoWrite(synced.c_str(), Pattern(32, 0x11).data()) == 0, "Finder info");
    Check(MAVOEAFileEAFSFinfoEASync(synced.c_str(), 1) == 0, "sync");
    Copy(on.file_ea + "copied", MakeObject(on.apple_double + "copied last"));
    Copy(on.xattr + "attributes", MakeObject(on.ea_directory + "copied last"));
}

// ---- read ---------------------------------------------------------------------------------------

std::string Show(const std::uint8_t* bytes, std::size_t size) {
    std::string text = std::to_string(size) + " bytes";
    char part[16];
    if (size > 32) {
        std::uint32_t hash = 2166136261U;  // FNV-1a
        for (std::size_t i = 0; i < size; ++i) hash = (hash ^ bytes[i]) * 16777619U;
        snprintf(part, sizeof part, " #%08x", static_cast<unsigned>(hash));
        return text + part;
    }
    for (std::size_t i = 0; i < size; ++i) {
        snprintf(part, sizeof part, " %02x", bytes[i]);
        text += part;
    }
    return text;
}
std::string Show(const Bytes& bytes) { return Show(bytes.data(), bytes.size()); }

void ReadStream(const std::string& object, int place) {
    WithStream(object, place, O_RDONLY, [](EASHandle* stream) {
        MLIBCSzList* names = MLIBCSzListAlloc(16);
        const int count = MAVOEASEnum(stream, &names);
        printf("  stream: %s, %d attributes\n", Show(stream->header, 120).c_str(), count);
        printf("  Finder info: %s\n", Show(stream->header + kFinderInfoAt, 32).c_str());
        for (int i = 0; i < count; ++i) {
            const char* const name = MLIBCSzListGet(names, i);
            Bytes value(static_cast<std::size_t>(
                std::max(0, MAVOEASRead(stream, name, stream->header, 0, 0))));
            const auto size = static_cast<unsigned>(value.size());
            Check(size == 0 ||
                      MAVOEASRead(stream, name, value.data(), size, 0) == static_cast<int>(size),
                  name);
            const EASEntry& entry = stream->entries[MAVOEASSearch(stream, name)];
            printf("  [%s] at %u, flags %u: %s\n", name, static_cast<unsigned>(entry.offset),
                   static_cast<unsigned>(entry.flags), Show(value).c_str());
        }
        MLIBCSzListFree(names);
    });
}

void ReadRecord(const char* kind, const std::string& object, int (*read)(const char*, EAAdouble*)) {
    EAAdouble record = {};
    const int result = read(object.c_str(), &record);
    if (result == 1) return;
    printf("  record of the %s: result %d, magic %08x, version %08x\n", kind, result,
           static_cast<unsigned>(record.magic), static_cast<unsigned>(record.version));
    for (std::size_t i = 0; i < 20; ++i) {
        const EAAdoubleEntry& entry = record.entries[i];
        if (entry.offset == 0) continue;
        const auto offset = static_cast<std::size_t>(entry.offset);
        const bool is_inside = offset + entry.length <= sizeof record.data;
        printf("  entry %zu at %lld: %s\n", i, static_cast<long long>(entry.offset),
               is_inside ? Show(record.data + offset, entry.length).c_str()
                         : std::to_string(entry.length).c_str());
    }
}

void ReadAttributes(const std::string& object) {
    MLIBCSzList* names = MLIBCSzListAlloc(16);
    Check(MAVOEAXattrEnum(object.c_str(), &names) == 0, "attributes of " + object);
    std::map<std::string, std::string> shown;
    for (int i = 0; MLIBCSzListGet(names, i) != nullptr; ++i) {
        const std::string name = MLIBCSzListGet(names, i);
        Bytes value(4096);
        const int size = MAVOEAXattrGet(object.c_str(), name.c_str(), value.data(), 4096);
        Check(size >= 0, name);
        value.resize(static_cast<std::size_t>(std::max(0, size)));
        shown[name] = Show(value);
    }
    for (const auto& [name, value] : shown) printf("  %s: %s\n", name.c_str(), value.c_str());
    MLIBCSzListFree(names);
}

void Read(const std::string& dir) {
    const Volumes on(dir);
    for (const std::string& volume : {on.apple_double, on.ea_directory, on.file_ea, on.xattr}) {
        for (const std::string& name : NamesIn(volume)) {
            const std::string path = volume + name;
            if (MAVOEAIsHiddenFile(name.c_str()) != 0) continue;
            std::uint8_t status[128] = {};
            std::uint32_t word = 0;
            Check(MLIBCFileStat(path.c_str(), 3, status) == 0, path);
            memcpy(&word, status + 116, sizeof word);
            printf("%s: marks %08x\n", path.substr(dir.size()).c_str(),
                   static_cast<unsigned>(word));
            const int place = volume == on.apple_double ? EA_PLACE_APPLEDOUBLE : EA_PLACE_EADIR;
            char file[MAVOEA_PATH_SIZE + 1];
            Check(MAVOEAPath(EA_FORM_FILE, path.c_str(), MAVOEA_KIND_STREAM, file, MAVOEA_PATH_SIZE,
                             place) == 0,
                  path);
            if (Exists(file)) ReadStream(path, place);
            if (place == EA_PLACE_APPLEDOUBLE) {
                printf("  AppleDouble file: %d\n", MAVOEACheckADFile(file));
            }
            ReadRecord("attribute", path, MAVOEAFileEAAdoubleRead);
            ReadRecord("resource file", path, MAVOEAEADirAdoubleRead);
            ReadAttributes(path);
        }
    }
}

// ---- list ---------------------------------------------------------------------------------------

void List(const std::string& dir) {
    std::vector<std::string> paths;
    for (const auto& entry : std::filesystem::recursive_directory_iterator(dir)) {
        paths.push_back(entry.path().string());
    }
    std::sort(paths.begin(), paths.end());
    for (const std::string& path : paths) {
        struct stat info = {};
        Check(lstat(path.c_str(), &info) == 0, path);
        printf("%s: mode %o", path.substr(dir.size()).c_str(), static_cast<unsigned>(info.st_mode));
        if (S_ISREG(info.st_mode)) printf(", %s", Show(ReadFile(path)).c_str());
        printf("\n");
        char names[4096];
        const ssize_t size = llistxattr(path.c_str(), names, sizeof names);
        Check(size >= 0, path);
        std::map<std::string, std::string> shown;
        for (ssize_t at = 0; at < size; at += static_cast<ssize_t>(strlen(names + at)) + 1) {
            std::uint8_t value[4096];
            const ssize_t length = lgetxattr(path.c_str(), names + at, value, sizeof value);
            Check(length >= 0, names + at);
            shown[names + at] = Show(value, static_cast<std::size_t>(std::max<ssize_t>(0, length)));
        }
        for (const auto& [name, value] : shown) printf("  %s: %s\n", name.c_str(), value.c_str());
    }
}

int Run(const std::string& command, const std::string& dir) {
    umask(022);
    if (geteuid() != 0) {
        printf("skipped: making EA directories takes the superuser\n");
        return kStatusSkipped;
    }
    if (setxattr(dir.c_str(), "user.mavoea.probe", "x", 1, 0) != 0 ||
        removexattr(dir.c_str(), "user.mavoea.probe") != 0) {
        printf("skipped: files in %s keep no extended attributes of users\n", dir.c_str());
        return kStatusSkipped;
    }
    if (command == "write") {
        Write(dir);
    } else if (command == "change") {
        Change(dir);
    } else if (command == "read") {
        Read(dir);
    } else if (command == "list") {
        List(dir);
    } else {
        return 2;
    }
    return failed ? 1 : 0;
}

}  // namespace
}  // namespace mavoea::test

int main(int argc, char** argv) {
    if (argc != 3) {
        fprintf(stderr, "usage: %s write|change|read|list DIR\n", argv[0]);
        return 2;
    }
    return mavoea::test::Run(argv[1], argv[2]);
}
