// mavoea salvage: what can still be read of an object's metadata, in files of their own.

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <functional>
#include <map>

#include "tests/support/mac_files.h"
#include "tests/support/object_files.h"
#include "tests/support/snapshot.h"
#include "tests/tool/holdings.h"
#include "tests/tool/tool.h"

namespace mavoea::test {
namespace {

using ::testing::AllOf;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;

class SalvageTest : public ::testing::Test {
 protected:
    SalvageTest() {
        MakeDir(dir_ / "share");
        WriteFile(object(), Ascii("data"));
    }

    std::string object() const { return dir_ / "share/a"; }
    std::string target() const { return dir_ / "salvaged"; }

    ToolResult Run(const Arguments& arguments) const {
        Arguments all = {"--volume", dir_ / "share=1"};
        all.insert(all.end(), arguments.begin(), arguments.end());
        return RunTool(all);
    }
    // The source stays as it is.
    ToolResult Salvage() const {
        const Snapshot before = TakeSnapshot(dir_ / "share");
        const ToolResult result = Run({"salvage", object(), target()});
        EXPECT_THAT(Differences(before, TakeSnapshot(dir_ / "share")), IsEmpty());
        return result;
    }
    std::map<std::string, Bytes> Files() const {
        std::map<std::string, Bytes> files;
        for (const std::string& name : NamesIn(target())) {
            if (name != "manifest.json") files[name] = ReadFile(target() + '/' + name);
        }
        return files;
    }
    nlohmann::json Manifest() const {
        const Bytes bytes = ReadFile(target() + "/manifest.json");
        return nlohmann::json::parse(bytes.begin(), bytes.end());
    }

    const TempDir dir_;
};

TEST_F(SalvageTest, AllOfWhatIsSoundIsWritten) {
    PutStream(object(),
              StreamImage{.attributes = {{"colour", Ascii("blue")}, {"empty", {}}}}.Build());
    PutResource(object(), ClassicFile(Pattern(32), Pattern(3000)).bytes);
    EXPECT_THAT(Salvage(), Succeeded());
    EXPECT_EQ((std::map<std::string, Bytes>{{"attribute.colour", Ascii("blue")},
                                            {"attribute.empty", {}},
                                            {"FinderInfo", Pattern(32)},
                                            {"ResourceFork", Pattern(3000)}}),
              Files());
    EXPECT_EQ(0700, ModeOf(target()));
    EXPECT_EQ(0600, ModeOf(target() + "/FinderInfo"));
    const nlohmann::json manifest = Manifest();
    EXPECT_EQ(object(), manifest["path"]);
    EXPECT_TRUE(manifest["problems"].empty());
    EXPECT_TRUE(manifest["missing"].empty());
    ASSERT_EQ(4U, manifest["files"].size());
    EXPECT_EQ((nlohmann::json{{"file", "attribute.colour"},
                              {"item", "\"colour\""},
                              {"name", "colour"},
                              {"from", dir_ / "share/@eaDir/a@MavoEAStream"},
                              {"size", 4},
                              {"of", 4}}),
              manifest["files"][0]);
}

TEST_F(SalvageTest, OfWhatIsDamagedAsMuchAsIsThereIsWrittenAndTheRestIsNamed) {
    StreamImage image{.attributes = {{"colour", Ascii("blue")}}, .fork = Pattern(100)};
    Bytes stream = image.Build();
    stream.resize(stream.size() - 40);
    PutStream(object(), stream);
    const ToolResult result = Salvage();
    EXPECT_EQ(2, result.status);
    EXPECT_THAT(result.err, AllOf(HasSubstr("its resource fork passes the end of the file"),
                                  HasSubstr("resource fork (60 of its 100 bytes can be read); what "
                                            "could is in " +
                                            target())));
    Bytes start = Pattern(100);
    start.resize(60);
    EXPECT_EQ((std::map<std::string, Bytes>{{"attribute.colour", Ascii("blue")},
                                            {"ResourceFork", start}}),
              Files());
    EXPECT_EQ(60, Manifest()["files"][1]["size"]);
    EXPECT_EQ(100, Manifest()["files"][1]["of"]);
    EXPECT_EQ(1U, Manifest()["missing"].size());
    EXPECT_EQ(1U, Manifest()["problems"].size());
}

TEST_F(SalvageTest, ASecondValueIsNamedAndMarksAreSaid) {
    PutStream(object(), StreamImage{.finder_info = Pattern(32, 1)}.Build());
    PutResource(object(), ClassicFile(Pattern(32, 2), {}).bytes);
    ASSERT_EQ(0, RunTool({"lock", object()}).status);
    const ToolResult result = Salvage();
    EXPECT_EQ(2, result.status);
    EXPECT_THAT(result.err, HasSubstr("a second Finder info in "));
    EXPECT_EQ((std::map<std::string, Bytes>{{"FinderInfo", Pattern(32, 2)}}), Files());
    ASSERT_EQ(1U, Manifest()["missing"].size());
    EXPECT_THAT(Manifest()["missing"][0]["name"].get<std::string>(), HasSubstr("a@MavoEAStream"));
    EXPECT_EQ(nlohmann::json({"locked"}), Manifest()["marks"]);
}

TEST_F(SalvageTest, NamesCannotLeadAnywhere) {
    const std::string long_name(250, 'n');
    StreamImage image;
    for (const std::string& name :
         {std::string("../../up"), std::string("/etc/passwd"), std::string("two\nlines \xFF"),
          std::string("100%"), long_name}) {
        image.attributes.push_back({name, Ascii(name)});
    }
    PutStream(object(), image.Build());
    EXPECT_THAT(Salvage(), Succeeded());
    const std::map<std::string, Bytes> files = Files();
    ASSERT_EQ(5U, files.size());
    EXPECT_EQ(Ascii("../../up"), files.at("attribute...%2F..%2Fup"));
    EXPECT_EQ(Ascii("/etc/passwd"), files.at("attribute.%2Fetc%2Fpasswd"));
    EXPECT_EQ(Ascii("two\nlines \xFF"), files.at("attribute.two%0Alines%20%FF"));
    EXPECT_EQ(Ascii("100%"), files.at("attribute.100%25"));
    EXPECT_EQ(Ascii(long_name), files.at("attribute." + std::string(190, 'n') + "~4"));
    EXPECT_EQ(long_name, Manifest()["files"][4]["name"]);
    EXPECT_THAT(NamesIn(dir_.path()), ElementsAre("salvaged", "share"));
}

TEST_F(SalvageTest, NothingThatIsThereIsTouched) {
    PutStream(object(), StreamImage{.attributes = {{"colour", Ascii("blue")}}}.Build());
    MakeDir(dir_ / "elsewhere");
    const std::vector<std::function<void()>> ways = {
        [&] { MakeDir(target()); }, [&] { WriteFile(target(), Ascii("mine")); },
        [&] { ASSERT_EQ(0, symlink("elsewhere", target().c_str())); },
        [&] { ASSERT_EQ(0, symlink("nowhere", target().c_str())); }};
    for (const auto& put : ways) {
        put();
        const Snapshot before = TakeSnapshot(dir_.path());
        EXPECT_THAT(Run({"salvage", object(), target()}),
                    Failed(2, target() + ": File exists; try again, or check the volume"));
        EXPECT_THAT(Differences(before, TakeSnapshot(dir_.path())), IsEmpty());
        ASSERT_EQ(0, remove(target().c_str()));
    }
}

TEST_F(SalvageTest, WithoutAnyMetadataNoDirectoryIsMade) {
    EXPECT_EQ(1, Salvage().status);
    EXPECT_FALSE(Exists(target()));
}

}  // namespace
}  // namespace mavoea::test
