// Seeds of samba_stream_fuzz: attributes and names of streams.

#include "fuzz/seeds.h"
#include "tests/support/temp_dir.h"

namespace mavoea::fuzz {

using namespace mavoea::test;

void WriteSambaStreamSeeds(const std::string& directory) {
    WriteFile(directory + "/plain", Ascii("user.DosStream.a:$DATA"));
    WriteFile(directory + "/mapped", Ascii("user.DosStream.a\xEF\x80\xA2\xEF\x80\x81:$DATA"));
    WriteFile(directory + "/extent", Ascii("user.DosStreamExt.12.a:$DATA"));
    WriteFile(directory + "/name", Ascii("com.apple.metadata:kMDItem"));
    WriteFile(directory + "/long", Repeat('n', 234));
    WriteFile(directory + "/forbidden", Ascii("\"*:<>?\\|\x01\x1F"));
}

}  // namespace mavoea::fuzz
