// Writes the seeds of every fuzz target: `fuzz_corpus DIRECTORY` fills DIRECTORY/<target>/.

#include <cstdio>
#include <filesystem>
#include <string>

#include "fuzz/seeds.h"

namespace {

using namespace mavoea::fuzz;

struct Target {
    const char* name;
    void (*write_seeds)(const std::string& directory);
};

constexpr Target kTargets[] = {
    {"stream_fuzz", WriteStreamSeeds},
    {"record_fuzz", WriteRecordSeeds},
    {"import_fuzz", WriteImportSeeds},
    {"resource_copy_fuzz", WriteResourceCopySeeds},
    {"upgrade_fuzz", WriteUpgradeSeeds},
    {"afp_info_fuzz", WriteAfpInfoSeeds},
    {"attribute_text_fuzz", WriteAttributeTextSeeds},
    {"dos_attributes_fuzz", WriteDosAttributesSeeds},
    {"finder_info_fuzz", WriteFinderInfoSeeds},
    {"foreign_object_fuzz", WriteForeignObjectSeeds},
    {"mac_info_fuzz", WriteMacInfoSeeds},
    {"samba_stream_fuzz", WriteSambaStreamSeeds},
    {"apple_single_fuzz", WriteAppleSingleSeeds},
    {"mac_binary_fuzz", WriteMacBinarySeeds},
    {"bin_hex_fuzz", WriteBinHexSeeds},
};

}  // namespace

int main(int argc, char** argv) {
    if (argc != 2) {
        std::fprintf(stderr, "usage: fuzz_corpus DIRECTORY\n");
        return 2;
    }
    for (const Target& target : kTargets) {
        const std::filesystem::path directory = std::filesystem::path(argv[1]) / target.name;
        std::filesystem::create_directories(directory);
        target.write_seeds(directory.string());
    }
    return 0;
}
