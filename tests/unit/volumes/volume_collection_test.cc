// The volume collection on a controller: which source is converted and how,
// what a failed conversion leaves behind, and how the found volumes merge
// into the record's "volumes".
#include "volumes/volume_collection.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <iterator>

#include "config/hosted_volume_list.h"
#include "fixtures/fault_env.h"
#include "fixtures/log_capture.h"
#include "fixtures/sandbox.h"

namespace kolt {
namespace {

namespace fs = std::filesystem;
using testing::FaultEnv;
using testing::FaultOp;
using testing::LogCapture;
using testing::Sandbox;

constexpr const char* kOurUUID = "5A5A5A5A-1111-4222-8333-444444444444";
constexpr const char* kOtherUUID = "0B0B0B0B-1111-4222-8333-444444444444";
const std::string kVorn = "/Library/Preferences/Vorn/";
const std::string kConverter = std::string(testing::kToolDirectory) + "pdcfgconvert";
constexpr double kNine = 700000000;  // 09:00 of some day, whole seconds
constexpr double kTen = kNine + 3600;

// A small valid text source; `inodes` tells one version from another.
std::string miniCfg(int inodes) {
  return "[Global]\nInodeCacheSize " + std::to_string(inodes) +
         "\n[Disk D0]\nSectors 100\n[StripeGroup A]\nMetadata yes\nJournal yes\nNode D0 0\n";
}

std::string sample(const std::string& name) {
  std::ifstream in(fs::path(KOLT_SOURCE_DIR) / "tests/fixtures/volumes" / name, std::ios::binary);
  return std::string(std::istreambuf_iterator<char>(in), {});
}

Value markerConfig(const std::string& marker) {
  Value v;
  v.set("marker", marker);
  return v;
}

Value entry(const Value& config, double mtime, std::vector<std::string> controllers) {
  Value e;
  e.set("config", config);
  e.set("mtime", Value::date(mtime));
  Array list;
  for (auto& c : controllers) list.emplace_back(c);
  e.set("controllers", Value(std::move(list)));
  return e;
}

std::vector<std::string> controllersOf(const Value& volumes, const std::string& name) {
  std::vector<std::string> out;
  const Value* e = volumes.find(name);
  if (e == nullptr || e->findArray("controllers") == nullptr) return out;
  for (const Value& v : *e->findArray("controllers"))
    out.push_back(v.asString() ? *v.asString() : "?");
  return out;
}

// Records the converter's arguments and forwards every start.
class ConverterRecordingEnv : public EnvWrapper {
 public:
  using EnvWrapper::EnvWrapper;
  int runProcess(const ProcessSpec& spec, bool wait, ProcessResult* result) override {
    if (spec.executable == kConverter) {
      conversions.push_back(spec.arguments);
      EXPECT_TRUE(wait);
      EXPECT_EQ(spec.standardOutput.kind, StreamSpec::Kind::kPipe);
      EXPECT_EQ(spec.standardError.kind, StreamSpec::Kind::kNull);
      EXPECT_EQ(spec.standardInput.kind, StreamSpec::Kind::kNull);
    }
    return EnvWrapper::runProcess(spec, wait, result);
  }
  std::vector<std::vector<std::string>> conversions;
};

class VolumeCollectionTest : public ::testing::Test {
 protected:
  VolumeCollectionTest() : faults_(&sandbox_.env()), spawns_(&faults_), scoped_(&spawns_) {
    sandbox_.setHardwareUUID(kOurUUID);
    fs::copy_file(fs::path(KOLT_BINARY_DIR) / "pdcfgconvert", sandbox_.hostPath(kConverter));
    sandbox_.installTool("qmadmin");
    host({"Projects", "Scratch", "Mini"});
  }

  void host(const std::vector<std::string>& names) {
    std::string text;
    for (const auto& n : names) text += n + " . 0\n";
    sandbox_.writeFile(kFsmlistPath, text);
  }
  void put(const std::string& name, const std::string& contents, double date) {
    sandbox_.writeFile(kVorn + name, contents);
    sandbox_.setModificationTime(kVorn + name, date);
  }
  void putCfgp(const std::string& name, const Value& config, double date) {
    put(name + ".cfgp", *writeXmlPropertyList(config), date);
  }
  // Replaces the real converter with the recording stand-in.
  void useStandInConverter(int exitStatus, const std::string& output) {
    sandbox_.installTool("pdcfgconvert");
    sandbox_.setToolExitStatus("pdcfgconvert", exitStatus);
    sandbox_.setToolOutput("pdcfgconvert", output);
  }
  int collect(Value& volumes, int flags = 0) {
    buildVolumeConfig(volumes, &flags);
    return flags;
  }
  std::optional<double> date(const std::string& name) {
    return sandbox_.modificationTime(kVorn + name);
  }
  bool exists(const std::string& name) { return sandbox_.exists(kVorn + name); }
  Value parsedFile(const std::string& name) {
    return *parsePropertyList(*sandbox_.readFile(kVorn + name));
  }

  Sandbox sandbox_;
  FaultEnv faults_;
  ConverterRecordingEnv spawns_;
  ScopedEnv scoped_;
  LogCapture logs_;
};

// --- Conversion -------------------------------------------------------------

TEST_F(VolumeCollectionTest, NewerCfgIsConvertedWithItsCompanionAndTheOlderCfgxStays) {
  put("Projects.cfg", sample("Projects.cfg"), kTen);
  put("Projects-auxdata.plist", sample("Projects-auxdata.plist"), kTen);
  put("Projects.cfgx", sample("Projects.cfgx"), kNine);
  Value volumes = Value::dictionary();

  EXPECT_EQ(collect(volumes), kBuildPublish);

  ASSERT_EQ(spawns_.conversions.size(), 1u);
  EXPECT_EQ(spawns_.conversions[0],
            (std::vector<std::string>{"-n", "Projects", "-F", "plist", "-A",
                                      "/Library/Preferences/Vorn//Projects.cfg"}));
  EXPECT_EQ(date("Projects.cfgp"), kTen);
  EXPECT_FALSE(exists("Projects.cfg"));
  EXPECT_FALSE(exists("Projects-auxdata.plist"));
  EXPECT_TRUE(exists("Projects.cfgx"));
  const Value* e = volumes.find("Projects");
  ASSERT_NE(e, nullptr);
  EXPECT_TRUE(*e->find("config") == parsedFile("Projects.cfgp"));
  EXPECT_NE(e->find("config")->find("auxData"), nullptr);  // the companion was read
  EXPECT_TRUE(*e->find("mtime") == Value::date(kTen));
  EXPECT_EQ(controllersOf(volumes, "Projects"), std::vector<std::string>{kOurUUID});
  // Nothing but the volume files is left in the directory: no temporary file.
  EXPECT_EQ(sandbox_.listNames(kVorn),
            (std::vector<std::string>{"Projects.cfgp", "Projects.cfgx", "fsmlist"}));
}

TEST_F(VolumeCollectionTest, EqualDatesPickTheCfg) {
  put("Projects.cfg", sample("Projects.cfg"), kTen);
  put("Projects.cfgx", sample("Projects.cfgx"), kTen);
  Value volumes = Value::dictionary();
  collect(volumes);
  ASSERT_EQ(spawns_.conversions.size(), 1u);
  EXPECT_EQ(spawns_.conversions[0].back(), "/Library/Preferences/Vorn//Projects.cfg");
  EXPECT_EQ(spawns_.conversions[0][4], "-A");
  EXPECT_TRUE(exists("Projects.cfgx"));
}

TEST_F(VolumeCollectionTest, NewerCfgxIsConvertedWithoutCompanionAndTheCfgStays) {
  put("Scratch.cfg", sample("Scratch.cfg"), kNine);
  put("Scratch-auxdata.plist", "<plist/>", kNine);
  put("Scratch.cfgx", sample("Scratch.cfgx"), kTen);
  Value volumes = Value::dictionary();
  collect(volumes);
  ASSERT_EQ(spawns_.conversions.size(), 1u);
  EXPECT_EQ(spawns_.conversions[0],
            (std::vector<std::string>{"-n", "Scratch", "-F", "plist",
                                      "/Library/Preferences/Vorn//Scratch.cfgx"}));
  EXPECT_FALSE(exists("Scratch.cfgx"));
  EXPECT_TRUE(exists("Scratch.cfg"));
  EXPECT_TRUE(exists("Scratch-auxdata.plist"));
  EXPECT_EQ(date("Scratch.cfgp"), kTen);
}

TEST_F(VolumeCollectionTest, CfgpDatedAsOrAfterItsSourceIsNotConverted) {
  put("Mini.cfg", miniCfg(1), kTen);
  putCfgp("Mini", markerConfig("current"), kTen);
  put("Scratch.cfgx", sample("Scratch.cfgx"), kNine + 0.5);
  putCfgp("Scratch", markerConfig("newer"), kTen);
  Value volumes = Value::dictionary();

  collect(volumes);

  EXPECT_TRUE(spawns_.conversions.empty());
  EXPECT_TRUE(exists("Mini.cfg"));
  EXPECT_TRUE(*volumes.find("Mini")->find("config") == markerConfig("current"));
  EXPECT_TRUE(*volumes.find("Scratch")->find("config") == markerConfig("newer"));
}

TEST_F(VolumeCollectionTest, AnEditWithinTheSecondOfTheLastConversionIsConverted) {
  putCfgp("Mini", markerConfig("old"), kTen + 0.2);
  put("Mini.cfg", miniCfg(2048), kTen + 0.7);
  Value volumes = Value::dictionary();
  collect(volumes);
  ASSERT_EQ(spawns_.conversions.size(), 1u);
  EXPECT_EQ(volumes.find("Mini")
                ->find("config")
                ->find("global")
                ->find("inodeCacheSize")
                ->asInteger()
                ->bits,
            2048);
}

// --- What a failed conversion leaves ----------------------------------------

// The state a failed conversion must leave exactly as it was: the edited
// source, the older ".cfgp", another volume's entry and a stale entry that a
// merge would have released.
class FailedConversionTest : public VolumeCollectionTest {
 protected:
  void SetUp() override {
    put("Mini.cfg", miniCfg(4096), kTen);
    putCfgp("Mini", markerConfig("old"), kNine);
    putCfgp("Projects", markerConfig("projects"), kNine);
    volumes_.set("Mini", entry(markerConfig("old"), kNine, {kOurUUID}));
    volumes_.set("Released", entry(markerConfig("r"), kNine, {kOurUUID}));
    before_ = volumes_;
    names_ = sandbox_.listNames(kVorn);
    cfg_ = *sandbox_.readFile(kVorn + "Mini.cfg");
    cfgp_ = *sandbox_.readFile(kVorn + "Mini.cfgp");
  }
  void expectUntouched(int flags) {
    EXPECT_EQ(flags, 0);
    EXPECT_TRUE(volumes_ == before_) << volumes_.description();
    EXPECT_EQ(sandbox_.listNames(kVorn), names_);
    EXPECT_EQ(sandbox_.readFile(kVorn + "Mini.cfg"), cfg_);
    EXPECT_EQ(date("Mini.cfg"), kTen);
    EXPECT_EQ(sandbox_.readFile(kVorn + "Mini.cfgp"), cfgp_);
    EXPECT_EQ(date("Mini.cfgp"), kNine);
  }
  Value volumes_;
  Value before_;
  std::vector<std::string> names_;
  std::string cfg_, cfgp_;
};

TEST_F(FailedConversionTest, ConverterExitingNonZero) {
  useStandInConverter(3, "<?xml version=\"1.0\"?><plist version=\"1.0\"><dict/></plist>");
  expectUntouched(collect(volumes_));
  EXPECT_TRUE(logs_.contains("Error creating cfgp for volume Mini"));
  EXPECT_TRUE(logs_.contains("Code=3"));
}

TEST_F(FailedConversionTest, ConverterPrintingGarbageOrATruncatedList) {
  for (const std::string& output :
       {std::string("not a property list"),
        std::string("<?xml version=\"1.0\"?><plist version=\"1.0\"><dict><key>a</key>"),
        std::string()}) {
    SCOPED_TRACE(output);
    useStandInConverter(0, output);
    expectUntouched(collect(volumes_));
  }
  EXPECT_TRUE(logs_.contains("Code=506"));
}

TEST_F(FailedConversionTest, ConverterThatCannotStart) {
  sandbox_.removeFile(kConverter);
  expectUntouched(collect(volumes_));
}

TEST_F(FailedConversionTest, FailureWhileReplacingTheCfgp) {
  // The second rename is the one that puts the dated file in place.
  const std::pair<FaultOp, int> faults[] = {
      {FaultOp::kCreate, 1}, {FaultOp::kAppend, 1}, {FaultOp::kFileSync, 1},
      {FaultOp::kClose, 1},  {FaultOp::kRename, 1}, {FaultOp::kSetModificationTime, 1},
      {FaultOp::kRename, 2}};
  for (const auto& [op, nth] : faults) {
    SCOPED_TRACE(std::string(testing::faultOpName(op)) + " #" + std::to_string(nth));
    faults_.clearFaults();
    faults_.failNth(op, nth, EIO);
    expectUntouched(collect(volumes_));
  }
  // Once the disk recovers, the edit goes through.
  faults_.clearFaults();
  EXPECT_EQ(collect(volumes_), kBuildPublish);
  EXPECT_FALSE(exists("Mini.cfg"));
  EXPECT_EQ(date("Mini.cfgp"), kTen);
}

TEST_F(VolumeCollectionTest, ConverterOutputThatIsNotUtf8IsPassedOverSilently) {
  useStandInConverter(0, "<plist>\xff\xfe</plist>");
  put("Mini.cfg", miniCfg(1), kTen);
  Value volumes;
  volumes.set("Released", entry(markerConfig("r"), kNine, {kOtherUUID, kOurUUID}));

  EXPECT_EQ(collect(volumes), kBuildPublish);

  EXPECT_FALSE(exists("Mini.cfgp"));
  EXPECT_TRUE(exists("Mini.cfg"));
  EXPECT_EQ(volumes.find("Mini"), nullptr);
  // The rest of the build goes on: the volume without files is released.
  EXPECT_EQ(controllersOf(volumes, "Released"), std::vector<std::string>{kOtherUUID});
}

// --- Scan -------------------------------------------------------------------

TEST_F(VolumeCollectionTest, VolumeFileNotInFsmlistIsIgnoredAndReleased) {
  host({"Projects"});
  putCfgp("Projects", markerConfig("p"), kNine);
  putCfgp("Other", markerConfig("o"), kNine);
  put("Other.cfg", miniCfg(1), kTen);
  Value volumes;
  volumes.set("Projects", entry(markerConfig("p"), kNine, {kOurUUID}));
  volumes.set("Other", entry(markerConfig("o"), kNine, {kOtherUUID, kOurUUID, kOurUUID}));

  EXPECT_EQ(collect(volumes), kBuildPublish);

  EXPECT_TRUE(logs_.contains("Ignoring extraneous volume config Other.cfgp"));
  EXPECT_TRUE(logs_.contains("Ignoring extraneous volume config Other.cfg"));
  EXPECT_TRUE(spawns_.conversions.empty());
  EXPECT_EQ(controllersOf(volumes, "Other"), std::vector<std::string>{kOtherUUID});
  EXPECT_EQ(controllersOf(volumes, "Projects"), std::vector<std::string>{kOurUUID});
}

TEST_F(VolumeCollectionTest, NewControllerJoinsEveryVolumeAndWritesItsFiles) {
  host({"Projects"});
  putCfgp("Projects", markerConfig("p"), kNine);
  Value volumes;
  volumes.set("Projects", entry(markerConfig("p"), kNine, {kOtherUUID}));
  volumes.set("Remote", entry(markerConfig("remote"), kNine, {kOtherUUID}));

  const int flags = collect(volumes, kBuildNewController);

  // Joining Projects (which it has files for) is a change; joining Remote
  // alone would not be.
  EXPECT_EQ(flags, kBuildNewController | kBuildPublish);
  EXPECT_EQ(controllersOf(volumes, "Projects"), (std::vector<std::string>{kOtherUUID, kOurUUID}));
  EXPECT_EQ(controllersOf(volumes, "Remote"), (std::vector<std::string>{kOtherUUID, kOurUUID}));
  // The volume update ran: both volumes are now hosted here.
  EXPECT_EQ(sandbox_.readFile(kFsmlistPath), "Projects . 0\nRemote . 0\n");
  EXPECT_TRUE(parsedFile("Remote.cfgp") == markerConfig("remote"));
  EXPECT_EQ(date("Remote.cfgp"), kNine);
  EXPECT_EQ(sandbox_.waitForToolCalls(1).size(), 1u);  // qmadmin starts Remote
}

TEST_F(VolumeCollectionTest, NewControllerWithoutFilesMarksNoChangeOfItsOwn) {
  host({});
  Value volumes;
  volumes.set("Remote", entry(markerConfig("remote"), kNine, {kOtherUUID}));
  EXPECT_EQ(collect(volumes, kBuildNewController), kBuildNewController);
  EXPECT_EQ(controllersOf(volumes, "Remote"), (std::vector<std::string>{kOtherUUID, kOurUUID}));
  EXPECT_EQ(sandbox_.waitForToolCalls(1).size(), 1u);  // qmadmin starts Remote
}

TEST_F(VolumeCollectionTest, ListingFailureLeavesTheVolumesAlone) {
  class FailingListEnv : public EnvWrapper {
   public:
    using EnvWrapper::EnvWrapper;
    int listDirectory(const std::string&, std::vector<DirectoryEntry>* entries) override {
      entries->assign(1, DirectoryEntry{"Projects.cfgp", kNine, false});
      return EMFILE;
    }
  } failing(&spawns_);
  ScopedEnv scoped(&failing);
  putCfgp("Projects", markerConfig("p"), kNine);
  Value volumes;
  volumes.set("Mini", entry(markerConfig("m"), kNine, {kOurUUID}));
  const Value before = volumes;

  EXPECT_EQ(collect(volumes), 0);

  EXPECT_TRUE(volumes == before);
  EXPECT_TRUE(logs_.contains("Error got error '"));
  EXPECT_TRUE(logs_.contains("' for url 'file:///Library/Preferences/Vorn/'"));
}

// --- Merge ------------------------------------------------------------------

TEST_F(VolumeCollectionTest, CurrentHostedEntryIsLeftAloneAtWholeSecondPrecision) {
  // The file keeps its fraction; the record, which went through XML, does not.
  putCfgp("Mini", markerConfig("m"), kTen + 0.75);
  Value volumes;
  volumes.set("Mini", entry(markerConfig("as published"), kTen, {kOtherUUID, kOurUUID}));
  const Value before = volumes;
  EXPECT_EQ(collect(volumes), 0);
  EXPECT_TRUE(volumes == before);
}

TEST_F(VolumeCollectionTest, StaleEntryTakesTheFileAndItsDate) {
  putCfgp("Mini", markerConfig("new"), kTen);
  Value volumes;
  volumes.set("Mini", entry(markerConfig("old"), kTen - 1, {kOurUUID}));
  EXPECT_EQ(collect(volumes), kBuildPublish);
  EXPECT_TRUE(volumes == Value(Dictionary::fromEntries(
                             {{"Mini", entry(markerConfig("new"), kTen, {kOurUUID})}})));
}

TEST_F(VolumeCollectionTest, CurrentEntryOfAnotherControllerGainsThisOne) {
  putCfgp("Mini", markerConfig("mine"), kTen);
  Value volumes;
  volumes.set("Mini", entry(markerConfig("theirs"), kTen, {kOtherUUID}));
  EXPECT_EQ(collect(volumes), kBuildPublish);
  // The configuration is current, so it is kept as published.
  EXPECT_TRUE(*volumes.find("Mini") == entry(markerConfig("theirs"), kTen, {kOtherUUID, kOurUUID}));
}

TEST_F(VolumeCollectionTest, EntryWithoutMtimeIsNotCurrent) {
  putCfgp("Mini", markerConfig("m"), kTen);
  Value volumes;
  Value e = entry(markerConfig("x"), kTen, {kOurUUID});
  e.erase("mtime");
  volumes.set("Mini", e);
  EXPECT_EQ(collect(volumes), kBuildPublish);
  EXPECT_TRUE(*volumes.find("Mini") == entry(markerConfig("m"), kTen, {kOurUUID}));
}

TEST_F(VolumeCollectionTest, UnreadableCfgpLeavesItsEntryAsItWas) {
  put("Mini.cfgp", "garbage", kTen);
  Value volumes;
  volumes.set("Mini", entry(markerConfig("m"), kNine, {kOurUUID}));
  const Value before = volumes;
  EXPECT_EQ(collect(volumes), 0);
  EXPECT_TRUE(volumes == before);
}

TEST_F(VolumeCollectionTest, VolumeWithoutFilesHereReleasesThisController) {
  Value volumes;
  volumes.set("Gone", entry(markerConfig("g"), kNine, {kOurUUID, kOtherUUID, kOurUUID}));
  volumes.set("Theirs", entry(markerConfig("t"), kNine, {kOtherUUID}));
  EXPECT_EQ(collect(volumes), kBuildPublish);
  EXPECT_EQ(controllersOf(volumes, "Gone"), std::vector<std::string>{kOtherUUID});
  EXPECT_EQ(controllersOf(volumes, "Theirs"), std::vector<std::string>{kOtherUUID});
}

}  // namespace
}  // namespace kolt
