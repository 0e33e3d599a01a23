// The seeds of each fuzz target, made by the tests' own builders. Each function writes one file a
// seed into `directory`, which exists.
#ifndef MAVOEA_FUZZ_SEEDS_H_
#define MAVOEA_FUZZ_SEEDS_H_

#include <string>

namespace mavoea::fuzz {

void WriteStreamSeeds(const std::string& directory);
void WriteRecordSeeds(const std::string& directory);
void WriteImportSeeds(const std::string& directory);
void WriteResourceCopySeeds(const std::string& directory);
void WriteUpgradeSeeds(const std::string& directory);
void WriteAttributeTextSeeds(const std::string& directory);
void WriteAfpInfoSeeds(const std::string& directory);
void WriteDosAttributesSeeds(const std::string& directory);
void WriteFinderInfoSeeds(const std::string& directory);
void WriteForeignObjectSeeds(const std::string& directory);
void WriteMacInfoSeeds(const std::string& directory);
void WriteSambaStreamSeeds(const std::string& directory);
void WriteAppleSingleSeeds(const std::string& directory);
void WriteMacBinarySeeds(const std::string& directory);
void WriteBinHexSeeds(const std::string& directory);

}  // namespace mavoea::fuzz

#endif  // MAVOEA_FUZZ_SEEDS_H_
