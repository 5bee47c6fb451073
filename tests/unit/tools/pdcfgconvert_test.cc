// The volume-configuration converter, run as the controller-side volume
// collection runs it: installed at its system path in a sandbox root, started
// through the Env with KOLT_ROOT naming the root, standard output a pipe.
#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <random>
#include <sstream>
#include <string>
#include <vector>

#include "fixtures/sandbox.h"
#include "kolt/env.h"
#include "kolt/error.h"
#include "kolt/plist.h"

namespace kolt {
namespace {

namespace fs = std::filesystem;
using namespace std::string_literals;

const std::string kToolPath = std::string(testing::kToolDirectory) + "pdcfgconvert";
constexpr const char* kVolumeDirectory = "/Library/Preferences/Vorn/";
constexpr const char* kStderrPath = "/converter-stderr.txt";
const fs::path kSamples = fs::path(KOLT_SOURCE_DIR) / "tests/fixtures/volumes";

std::string readHostFile(const fs::path& path) {
  std::ifstream in(path, std::ios::binary);
  std::stringstream contents;
  contents << in.rdbuf();
  return contents.str();
}

// Value equality with both values printed on failure.
void expectSameValue(const Value& actual, const Value& expected) {
  EXPECT_TRUE(actual == expected) << "actual:   " << actual.description()
                                  << "\nexpected: " << expected.description();
}

struct RunResult {
  int exitStatus = -1;
  std::string out;
  std::string err;
};

class PdcfgconvertTest : public ::testing::Test {
 protected:
  void SetUp() override {
    fs::copy_file(fs::path(KOLT_BINARY_DIR) / "pdcfgconvert", sandbox_.hostPath(kToolPath));
  }

  fs::path hostVolumePath(const std::string& fileName) const {
    return sandbox_.hostPath(kVolumeDirectory + fileName);
  }
  void writeVolumeFile(const std::string& fileName, const std::string& contents) {
    sandbox_.writeFile(kVolumeDirectory + fileName, contents);
  }
  void installSample(const std::string& fileName) {
    writeVolumeFile(fileName, readHostFile(kSamples / fileName));
  }

  // Runs `executable` through `env` (which names its root in KOLT_ROOT) with
  // standard input the null device, standard output `output` and standard
  // error a file of the sandbox.
  RunResult runIn(Env& env, const std::string& executable, std::vector<std::string> arguments,
                  StreamSpec output = StreamSpec::pipe()) {
    sandbox_.writeFile(kStderrPath, "");
    ProcessSpec child;
    child.executable = executable;
    child.arguments = std::move(arguments);
    child.standardOutput = std::move(output);
    child.standardError = StreamSpec::appendTo(kStderrPath);
    ProcessResult process;
    EXPECT_EQ(env.runProcess(child, /*wait=*/true, &process), 0);
    return {process.exitStatus, process.output, sandbox_.readFile(kStderrPath).value_or("")};
  }
  RunResult run(std::vector<std::string> arguments) {
    return runIn(sandbox_.env(), kToolPath, std::move(arguments));
  }
  // The volume collection's command line for a source file of the directory.
  RunResult convert(const std::string& volume, const std::string& fileName, bool auxData = false) {
    std::vector<std::string> arguments = {"-n", volume, "-F", "plist"};
    if (auxData) arguments.push_back("-A");
    arguments.push_back(std::string(kVolumeDirectory) + "/" + fileName);
    return run(arguments);
  }
  // Converts and parses; fails the test when either step fails.
  Value convertToValue(const std::string& volume, const std::string& fileName,
                       bool auxData = false) {
    const RunResult result = convert(volume, fileName, auxData);
    EXPECT_EQ(result.exitStatus, 0) << result.err;
    EXPECT_EQ(result.err, "");
    std::optional<Error> error;
    std::optional<Value> value = parsePropertyList(result.out, &error);
    EXPECT_TRUE(value.has_value()) << (error && error->description() ? *error->description() : "");
    return value.value_or(Value());
  }

  // A failing run: non-zero status, nothing on standard output, and a message
  // holding every fragment.
  void expectFailure(const RunResult& result, int exitStatus,
                     const std::vector<std::string>& fragments) {
    EXPECT_EQ(result.exitStatus, exitStatus) << result.err;
    EXPECT_EQ(result.out, "");
    for (const std::string& fragment : fragments) {
      EXPECT_NE(result.err.find(fragment), std::string::npos)
          << "message lacks \"" << fragment << "\": " << result.err;
    }
  }

  testing::Sandbox sandbox_;
};

Value disk(std::int64_t sectors, std::int64_t sectorSize) {
  Value d;
  d.set("sectors", Value::integer(sectors));
  d.set("sectorSize", Value::integer(sectorSize));
  return d;
}

Value nodes(std::vector<std::string> disks) {
  Array list;
  for (std::size_t i = 0; i < disks.size(); ++i) {
    Value node;
    node.set("disk", Value(disks[i]));
    node.set("index", Value::integer(static_cast<std::int64_t>(i)));
    list.push_back(node);
  }
  return Value(std::move(list));
}

Value stripeGroup(const std::string& name, bool metadata, bool exclusive, std::int64_t breadth,
                  std::vector<std::string> disks) {
  Value g;
  g.set("name", Value(name));
  g.set("status", Value("up"));
  g.set("metadata", Value::boolean(metadata));
  g.set("journal", Value::boolean(metadata));
  g.set("exclusive", Value::boolean(exclusive));
  g.set("read", Value::boolean(true));
  g.set("write", Value::boolean(true));
  g.set("stripeBreadth", Value::integer(breadth));
  g.set("nodes", nodes(std::move(disks)));
  return g;
}

// What Projects.cfg and Projects.cfgx describe.
Value expectedProjects() {
  Value global;
  global.set("fileLocks", Value::boolean(true));
  global.set("quotas", Value::boolean(true));
  global.set("inodeCacheSize", Value::integer(65536));
  global.set("journalSize", Value::integer(64 << 20));
  global.set("blockSize", Value::integer(16 << 10));
  global.set("allocationStrategy", Value("balance"));
  global.set("maxConnections", Value::integer(128));
  Value disks;
  disks.set("Meta0", disk(41943040, 512));
  disks.set("Data0", disk(3906250000, 4096));
  disks.set("Data1", disk(3906250000, 4096));
  disks.set("Video0", disk(7812500000, 4096));
  disks.set("Video1", disk(7812500000, 4096));
  Value video = stripeGroup("Video", false, true, 4 << 20, {"Video0", "Video1"});
  video.set("affinity", Value("Video"));
  Value volume;
  volume.set("name", Value("Projects"));
  volume.set("global", global);
  volume.set("disks", disks);
  volume.set("stripeGroups",
             Value(Array{stripeGroup("MetaJournal", true, true, 64 << 10, {"Meta0"}),
                         stripeGroup("Data", false, false, 1 << 20, {"Data0", "Data1"}), video}));
  return volume;
}

// A small valid volume in the text form; tests append to or edit it.
constexpr const char* kMinimalText =
    "[Global]\n"
    "[Disk d0]\n"
    "Sectors 1000\n"
    "[StripeGroup all]\n"
    "Metadata yes\n"
    "Journal yes\n"
    "Node d0 0\n";

TEST_F(PdcfgconvertTest, ConvertsTheTextFormIntoTheVolumesPropertyList) {
  installSample("Projects.cfg");
  const RunResult result = convert("Projects", "Projects.cfg");
  EXPECT_EQ(result.out.rfind("<?xml", 0), 0u) << result.out;
  expectSameValue(convertToValue("Projects", "Projects.cfg"), expectedProjects());
  // Conversion leaves the source in place; removing it is the caller's job.
  EXPECT_TRUE(fs::exists(hostVolumePath("Projects.cfg")));
}

TEST_F(PdcfgconvertTest, TextAndXmlFormsOfTheSameVolumeGiveTheSameOutput) {
  for (const std::string volume : {"Projects", "Scratch"}) {
    installSample(volume + ".cfg");
    installSample(volume + ".cfgx");
    const RunResult text = convert(volume, volume + ".cfg");
    const RunResult xml = convert(volume, volume + ".cfgx");
    EXPECT_EQ(text.exitStatus, 0) << text.err;
    EXPECT_EQ(xml.exitStatus, 0) << xml.err;
    EXPECT_FALSE(text.out.empty());
    EXPECT_EQ(text.out, xml.out) << volume;
  }
  // Scratch leaves every optional key out: the output carries the defaults.
  const Value scratch = convertToValue("Scratch", "Scratch.cfgx");
  const Value* global = scratch.find("global");
  ASSERT_NE(global, nullptr);
  Value expectedGlobal;
  expectedGlobal.set("fileLocks", Value::boolean(false));
  expectedGlobal.set("quotas", Value::boolean(false));
  expectedGlobal.set("inodeCacheSize", Value::integer(32768));
  expectedGlobal.set("journalSize", Value::integer(16 << 20));
  expectedGlobal.set("blockSize", Value::integer(16 << 10));
  expectedGlobal.set("allocationStrategy", Value("round"));
  expectedGlobal.set("maxConnections", Value::integer(32));
  expectSameValue(*global, expectedGlobal);
  const Array* groups = scratch.findArray("stripeGroups");
  ASSERT_TRUE(groups != nullptr && groups->size() == 1);
  Value expectedGroup = stripeGroup("All", true, false, 256 << 10, {"Scratch0"});
  expectSameValue((*groups)[0], expectedGroup);
  expectSameValue(*scratch.find("disks"),
                  Value(Dictionary::fromEntries({{"Scratch0", disk(1953125000, 512)}})));
}

TEST_F(PdcfgconvertTest, LayoutOfTheTextFormDoesNotChangeTheOutput) {
  writeVolumeFile("a.cfg", kMinimalText);
  // CR LF line ends, tabs, indentation, comments and blank lines.
  writeVolumeFile("b.cfg",
                  "# comment\r\n\r\n  [Global]  \r\n\t[ Disk\td0 ]\r\n\tSectors\t1000\r\n"
                  "   # indented comment\r\n[StripeGroup all]\r\nNode d0 0\r\nJournal true\r\n"
                  "Metadata yes");
  const RunResult a = convert("a", "a.cfg");
  const RunResult b = convert("a", "b.cfg");
  EXPECT_EQ(a.exitStatus, 0) << a.err;
  EXPECT_EQ(b.exitStatus, 0) << b.err;
  EXPECT_EQ(a.out, b.out);
}

TEST_F(PdcfgconvertTest, CompanionFileIsMergedOnlyWithTheAuxDataOption) {
  installSample("Projects.cfg");
  const Value plain = convertToValue("Projects", "Projects.cfg", /*auxData=*/true);
  expectSameValue(plain, expectedProjects());  // -A without a companion file adds nothing

  installSample("Projects-auxdata.plist");
  const std::optional<Value> auxData =
      parsePropertyList(readHostFile(kSamples / "Projects-auxdata.plist"));
  ASSERT_TRUE(auxData.has_value());
  Value expected = expectedProjects();
  expected.set("auxData", *auxData);
  expectSameValue(convertToValue("Projects", "Projects.cfg", /*auxData=*/true), expected);
  expectSameValue(convertToValue("Projects", "Projects.cfg", /*auxData=*/false),
                  expectedProjects());
  EXPECT_TRUE(fs::exists(hostVolumePath("Projects-auxdata.plist")));

  writeVolumeFile("Projects-auxdata.plist", "<plist><dict><key>a</key></dict></plist>");
  expectFailure(convert("Projects", "Projects.cfg", true), 1,
                {"Projects-auxdata.plist", "not a valid property list"});
  fs::remove(hostVolumePath("Projects-auxdata.plist"));
  fs::create_directory(hostVolumePath("Projects-auxdata.plist"));
  expectFailure(convert("Projects", "Projects.cfg", true), 1, {"Projects-auxdata.plist"});
}

TEST_F(PdcfgconvertTest, PathsAreMappedBelowTheRootOnlyWhenOneIsSet) {
  installSample("Scratch.cfg");
  const RunResult sandboxed = convert("Scratch", "Scratch.cfg");
  ASSERT_EQ(sandboxed.exitStatus, 0) << sandboxed.err;
  // With the root "/" (as when KOLT_ROOT is unset) paths are the host's own.
  std::unique_ptr<Env> host = newPosixEnv("/");
  const RunResult direct =
      runIn(*host, (fs::path(KOLT_BINARY_DIR) / "pdcfgconvert").string(),
            {"-n", "Scratch", "-F", "plist", hostVolumePath("Scratch.cfg").string()});
  EXPECT_EQ(direct.exitStatus, 0) << direct.err;
  EXPECT_EQ(direct.out, sandboxed.out);
  // A sandboxed path cannot climb out of the root.
  expectFailure(run({"-n", "Scratch", "/Library/../Library/Preferences/Vorn/Scratch.cfg"}), 1,
                {"\"..\""});
}

TEST_F(PdcfgconvertTest, HelpDescribesTheCommandLineAndBothForms) {
  const RunResult result = run({"-h"});
  EXPECT_EQ(result.exitStatus, 0);
  EXPECT_EQ(result.err, "");
  for (const char* fragment : {"-n <volume>", "-F plist", "-A", "-auxdata.plist", "KOLT_ROOT",
                               "[StripeGroup <name>]", "<volumeConfig", "StripeBreadth"}) {
    EXPECT_NE(result.out.find(fragment), std::string::npos) << fragment;
  }
}

TEST_F(PdcfgconvertTest, CommandLineErrorsExitWithStatusTwo) {
  installSample("Scratch.cfg");
  installSample("Scratch.cfgx");
  const std::string source = std::string(kVolumeDirectory) + "Scratch.cfg";
  const struct {
    std::vector<std::string> arguments;
    std::string fragment;
  } cases[] = {
      {{}, "volume name"},
      {{source}, "volume name"},
      {{"-n", "Scratch"}, "source file is missing"},
      {{"-n"}, "-n needs a value"},
      {{"-x", "-n", "Scratch", source}, "unknown option \"-x\""},
      {{"-n", "Scratch", "-n", "Scratch", source}, "given twice"},
      {{"-n", "Scratch", "-F", "xml1", source}, "output format \"xml1\""},
      {{"-n", "Scratch", "-A", source + "x"}, "-A applies to a .cfg source only"},
      {{"-n", "Scratch", std::string(kVolumeDirectory) + "Scratch.cfgp"}, "end in .cfg or .cfgx"},
      {{"-n", "Scratch", source, source}, "more than one source"},
      {{"-n", "../Scratch", source}, "bad volume name"},
      {{"-n", "Scr.atch", source}, "bad volume name"},
      {{"-n", "", source}, "bad volume name"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.fragment);
    expectFailure(run(c.arguments), 2, {c.fragment, "usage:"});
  }
}

TEST_F(PdcfgconvertTest, UnreadableSourcesFailWithTheReason) {
  expectFailure(convert("v", "v.cfg"), 1, {"v.cfg", "No such file or directory"});
  fs::create_directory(hostVolumePath("d.cfgx"));
  expectFailure(convert("d", "d.cfgx"), 1, {"d.cfgx", "Is a directory"});
  // Larger than the limit, though each line alone is fine.
  std::string large = kMinimalText;
  while (large.size() <= (4u << 20)) large += "# padding padding padding padding padding\n";
  writeVolumeFile("big.cfg", large);
  expectFailure(convert("big", "big.cfg"), 1, {"big.cfg", "larger than 4 MiB"});
}

// Each case: a text source, the line at fault (0: none) and a fragment of the
// message.
struct SourceCase {
  std::string source;
  int line;
  std::string fragment;
};

const SourceCase kTextErrors[] = {
    {"[Global]\nFoo 1\n", 2, "unknown key \"Foo\" in [Global]"},
    {"[Globl]\n", 1, "unknown section \"Globl\""},
    {"FileLocks yes\n[Global]\n", 1, "before any section header"},
    {"# c\n[Global\n", 2, "section header"},
    {"[Global]\n[]\n", 2, "section header"},
    {"[Global] x\n", 1, "section header"},
    {"[Global extra]\n", 1, "[Global] takes no name"},
    {"[Global]\n[Disk]\n", 2, "[Disk] needs a name"},
    {"[Global]\n[Disk a/b]\n", 2, "bad name \"a/b\""},
    {"[Global]\nFileLocks maybe\n", 2,
     "FileLocks: expected yes, no, true or false, found \"maybe\""},
    {"[Global]\nFileLocks Yes\n", 2, "FileLocks: expected"},
    {"[Global]\nFileLocks\n", 2, "FileLocks takes 1 value, found 0"},
    {"[Global]\nFileLocks yes no\n", 2, "FileLocks takes 1 value, found 2"},
    {"[Global]\nInodeCacheSize 12abc\n", 2, "InodeCacheSize: expected a whole number"},
    {"[Global]\nInodeCacheSize -5\n", 2, "InodeCacheSize: expected a whole number"},
    {"[Global]\nInodeCacheSize 99999999999999999999999\n", 2, "InodeCacheSize"},
    {"[Global]\nMaxConnections 0\n", 2, "from 1 to 65535"},
    {"[Global]\nJournalSize 16X\n", 2, "JournalSize: expected a size"},
    {"[Global]\nJournalSize 9999999999T\n", 2, "JournalSize: expected a size"},
    {"[Global]\nBlockSize 12K\n", 2, "BlockSize: expected a power of two"},
    {"[Global]\nAllocationStrategy round\n", 2, "expected Round, Fill or Balance"},
    {"[Global]\nQuotas no\nQuotas no\n", 3, "duplicate Quotas in [Global] (first at line 2)"},
    {"[Global]\n[Global]\n", 2, "duplicate section [Global] (first at line 1)"},
    {"[Global]\nFileLocks \x01yes\n", 2, "control character 0x01"},
    {"[Global]\nFileLocks yes\0\n"s, 2, "control character 0x00"},
    {"[Global]\n# caf\xC3\xA9 is fine\nFileLocks \xFFyes\n", 3, "not UTF-8"},
    {"[Global]\n# overlong \xC0\xAF\n", 2, "not UTF-8"},
    {"[Global]\n# \xED\xA0\x80 surrogate\n", 2, "not UTF-8"},
    {"[Global]\nNode d0 0\n", 2, "unknown key \"Node\" in [Global]"},
    // Checks of the volume as a whole.
    {"", 0, "no [Global] section"},
    {"[Global]\n", 0, "no stripe group"},
    {"[Global]\nVolume other\n", 2, "\"other\" does not match the name given with -n, \"v\""},
    {"[Global]\n[Disk d0]\nSectorSize 512\n", 2, "[Disk d0] has no Sectors"},
    {"[Global]\n[Disk d0]\nSectors 1\n[StripeGroup s]\nMetadata yes\nJournal yes\n", 4,
     "[StripeGroup s] has no Node"},
    {"[Global]\n[Disk d0]\nSectors 1\n[StripeGroup s]\nJournal yes\nNode d0 0\n", 0,
     "no stripe group holds the metadata"},
    {"[Global]\n[Disk d0]\nSectors 1\n[StripeGroup s]\nMetadata yes\nNode d0 0\n", 0,
     "no stripe group holds the journal"},
    {std::string(kMinimalText) + "[Disk d1]\nSectors 1\n[StripeGroup t]\nJournal yes\nNode d1 0\n",
     11, "[StripeGroup t] holds the journal too"},
    {std::string(kMinimalText) + "Node d9 1\n", 8, "Node d9 1 in [StripeGroup all]: no disk"},
    {std::string(kMinimalText) + "[StripeGroup t]\nNode d0 0\n", 9, "already used at line 7"},
    {std::string(kMinimalText) + "[Disk d1]\nSectors 1\n[StripeGroup t]\nNode d1 1\n", 11,
     "numbered 0 to 0"},
    {"[Global]\n[Disk d0]\nSectors 1\n[Disk d1]\nSectors 1\n[StripeGroup s]\nMetadata yes\n"
     "Journal yes\nNode d0 0\nNode d1 0\n",
     10, "index 0 is already used at line 9"},
    {"[Global]\n[Disk d0]\nSectors 1\n[StripeGroup s]\nMetadata yes\nJournal yes\n"
     "StripeBreadth 20K\nNode d0 0\n",
     7, "StripeBreadth 20K of [StripeGroup s] is not a multiple of the block size 16K"},
    {"[Global]\nBlockSize 1M\n[Disk d0]\nSectors 1\n[StripeGroup s]\nMetadata yes\n"
     "Journal yes\nNode d0 0\n",
     5, "StripeBreadth 256K of [StripeGroup s] is not a multiple of the block size 1M"},
};

// kMinimalText with one more line in each section; `diskLine` replaces the
// disk's Sectors when given.
std::string minimalWith(const std::string& globalLine, const std::string& diskLine,
                        const std::string& groupLine) {
  return "[Global]\n" + globalLine + "\n[Disk d0]\n" +
         (diskLine.empty() ? "Sectors 1000" : diskLine) +
         "\n[StripeGroup all]\nMetadata yes\nJournal yes\nNode d0 0\n" + groupLine + "\n";
}

TEST_F(PdcfgconvertTest, ValuesAtTheirBoundaries) {
  const struct {
    std::string source;
    bool accepted;
  } cases[] = {
      {minimalWith("", "Sectors 9223372036854775807", ""), true},
      {minimalWith("", "Sectors 9223372036854775808", ""), false},
      {minimalWith("", "Sectors 0", ""), false},
      {minimalWith("JournalSize 64G", "", ""), true},
      {minimalWith("JournalSize 65537M", "", ""), false},
      {minimalWith("JournalSize 1048575", "", ""), false},
      {minimalWith("JournalSize 1048576", "", ""), true},
      {minimalWith("MaxConnections 65535", "", ""), true},
      {minimalWith("MaxConnections 65536", "", ""), false},
      {minimalWith("", "", "StripeBreadth 1G"), true},
      {minimalWith("", "", "StripeBreadth 8388607T"), false},
      {minimalWith("", "", "StripeBreadth 8388608T"), false},  // 2^63: overflows
      {minimalWith("", "Sectors 1\nSectorSize 4096", ""), true},
      {minimalWith("", "Sectors 1\nSectorSize 8192", ""), false},
      {minimalWith("", "Sectors 1\nSectorSize 1000", ""), false},
      {minimalWith("#" + std::string(4095, 'x'), "", ""), true},
      {minimalWith("#" + std::string(4096, 'x'), "", ""), false},
      {minimalWith("#" + std::string(4095, 'x') + "\r", "", ""), true},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.source.substr(0, 120));
    writeVolumeFile("v.cfg", c.source);
    const RunResult result = convert("v", "v.cfg");
    if (c.accepted) {
      EXPECT_EQ(result.exitStatus, 0) << result.err;
    } else {
      expectFailure(result, 1, {"v.cfg:"});
    }
  }
  writeVolumeFile("v.cfg", minimalWith("JournalSize 64G", "Sectors 9223372036854775807", ""));
  const Value volume = convertToValue("v", "v.cfg");
  const Value* disks = volume.find("disks");
  ASSERT_NE(disks, nullptr);
  expectSameValue(*disks->find("d0"), disk(INT64_MAX, 512));
  expectSameValue(*volume.find("global")->find("journalSize"), Value::integer(64LL << 30));
}

TEST_F(PdcfgconvertTest, FailureToWriteTheOutputIsReported) {
  installSample("Scratch.cfg");
  sandbox_.makeDirectory("/dev");
  fs::create_symlink("/dev/full", sandbox_.hostPath("/dev/full"));
  const RunResult result = runIn(sandbox_.env(), kToolPath,
                                 {"-n", "Scratch", std::string(kVolumeDirectory) + "Scratch.cfg"},
                                 StreamSpec::appendTo("/dev/full"));
  expectFailure(result, 1, {"cannot write to standard output"});
}

TEST_F(PdcfgconvertTest, TextSourceErrorsNameTheProblemAndTheLine) {
  for (const SourceCase& c : kTextErrors) {
    SCOPED_TRACE(c.source);
    writeVolumeFile("v.cfg", c.source);
    const std::string location = c.line == 0 ? "v.cfg: " : "v.cfg:" + std::to_string(c.line) + ": ";
    expectFailure(convert("v", "v.cfg"), 1, {location, c.fragment});
  }
}

// A small valid volume in the XML form; tests edit it.
constexpr const char* kMinimalXml =
    "<?xml version=\"1.0\"?>\n"
    "<volumeConfig version=\"1\">\n"
    "  <global/>\n"
    "  <disk name=\"d0\"><sectors>1000</sectors></disk>\n"
    "  <stripeGroup name=\"all\">\n"
    "    <metadata>yes</metadata>\n"
    "    <journal>yes</journal>\n"
    "    <node disk=\"d0\" index=\"0\"/>\n"
    "  </stripeGroup>\n"
    "</volumeConfig>\n";

// kMinimalXml with the line `line` (1-based) replaced by `replacement`.
std::string editedXml(int line, const std::string& replacement) {
  std::istringstream in(kMinimalXml);
  std::string result, current;
  for (int n = 1; std::getline(in, current); ++n)
    result += (n == line ? replacement : current) + "\n";
  return result;
}

TEST_F(PdcfgconvertTest, XmlSourceErrorsNameTheProblemAndTheLine) {
  writeVolumeFile("v.cfgx", kMinimalXml);
  writeVolumeFile("v.cfg", kMinimalText);
  ASSERT_EQ(convert("v", "v.cfgx").out, convert("v", "v.cfg").out);
  const SourceCase cases[] = {
      {editedXml(3, "<global><fileLocks>maybe</fileLocks></global>"), 3,
       "<fileLocks>: expected yes, no, true or false, found \"maybe\""},
      {editedXml(3, "<global>\n<fileLock>yes</fileLock></global>"), 4,
       "unknown element <fileLock> in <global>"},
      {editedXml(3, "<global><quotas>no</quotas><quotas>no</quotas></global>"), 3,
       "duplicate <quotas> in <global>"},
      {editedXml(3, "<global><fileLocks><yes/></fileLocks></global>"), 3,
       "unexpected element <yes> inside <fileLocks>"},
      {editedXml(3, "<global><fileLocks a=\"1\">yes</fileLocks></global>"), 3,
       "<fileLocks> has no attribute \"a\""},
      {editedXml(3, "<global name=\"g\"/>"), 3, "<global> takes no name attribute"},
      {editedXml(3, "<global/><global/>"), 3, "duplicate section <global>"},
      {editedXml(3, "<globals/>"), 3, "unknown element <globals>"},
      {editedXml(3, "stray <global/>"), 3, "unexpected text \"stray\""},
      {editedXml(4, "<disk><sectors>1</sectors></disk>"), 4, "<disk> needs a name attribute"},
      {editedXml(8, "<node disk=\"d0\"/>"), 8, "<node> needs the attribute \"index\""},
      {editedXml(8, "<node disk=\"d0\" index=\"0\" slot=\"1\"/>"), 8,
       "<node> has no attribute \"slot\""},
      {editedXml(8, "<node disk=\"d0\" index=\"x\"/>"), 8, "<node> index: expected a whole number"},
      {editedXml(8, "<node disk=\"d0\" index=\"0\">d0</node>"), 8,
       "unexpected text \"d0\" in <node>"},
      {editedXml(8, "<node disk=\"d1\" index=\"0\"/>"), 8,
       "<node> d1 0 in <stripeGroup name=\"all\">"},
      {editedXml(7, "<journal>no</journal>"), 0, "no stripe group holds the journal"},
      {editedXml(2, "<volumeConfig version=\"2\">"), 2, "unsupported version \"2\""},
      {editedXml(2, "<volume>"), 2, "the root element must be <volumeConfig>, found <volume>"},
      {editedXml(9, "  </stripeGroups>"), 9, "malformed XML"},
      {editedXml(10, ""), 11, "malformed XML"},
      {"", 1, "malformed XML"},
      {editedXml(3, "<global><volume>w</volume></global>"), 3, "does not match the name given"},
      {"<?xml version=\"1.0\"?>\n<!DOCTYPE volumeConfig [<!ENTITY a \"aaaa\">]>\n"
       "<volumeConfig>&a;</volumeConfig>\n",
       2, "document type declarations are not allowed"},
  };
  for (const SourceCase& c : cases) {
    SCOPED_TRACE(c.source);
    writeVolumeFile("v.cfgx", c.source);
    const std::string location =
        c.line == 0 ? "v.cfgx: " : "v.cfgx:" + std::to_string(c.line) + ": ";
    expectFailure(convert("v", "v.cfgx"), 1, {location, c.fragment});
  }
}

TEST_F(PdcfgconvertTest, HostileSourcesFailCleanly) {
  // One line of a megabyte.
  writeVolumeFile("v.cfg", "[Global]\n# " + std::string(1 << 20, 'x') + "\n");
  expectFailure(convert("v", "v.cfg"), 1, {"v.cfg:2: ", "longer than 4096 bytes"});
  // A value far longer than any valid one, quoted short in the message.
  writeVolumeFile("v.cfg", "[Global]\nVolume " + std::string(4000, 'v') + "\n");
  const RunResult longName = convert("v", "v.cfg");
  expectFailure(longName, 1, {"v.cfg:2: ", "Volume: expected a name"});
  EXPECT_LT(longName.err.size(), 500u);

  // Many sections, the last repeating the first: found without comparing
  // every pair.
  std::string many = "[Global]\n";
  for (int i = 0; i < 200000; ++i) many += "[Disk d" + std::to_string(i) + "]\n";
  writeVolumeFile("v.cfg", many + "[Disk d0]\n");
  expectFailure(convert("v", "v.cfg"), 1,
                {"v.cfg:200002: ", "duplicate section [Disk d0] (first at line 2)"});

  // Binary garbage in both forms, from a fixed seed.
  std::mt19937 random(20240611);
  std::string garbage(64 << 10, '\0');
  for (char& c : garbage) c = static_cast<char>(random());
  writeVolumeFile("v.cfg", garbage);
  expectFailure(convert("v", "v.cfg"), 1, {"v.cfg:"});
  writeVolumeFile("v.cfgx", garbage);
  expectFailure(convert("v", "v.cfgx"), 1, {"v.cfgx:"});

  // Deep nesting stops at the first element below a key.
  std::string deep = "<volumeConfig><global><fileLocks>";
  for (int i = 0; i < 200000; ++i) deep += "<a>";
  writeVolumeFile("v.cfgx", deep);
  expectFailure(convert("v", "v.cfgx"), 1, {"unexpected element <a> inside <fileLocks>"});

  // An element name of a megabyte is shown cut short.
  writeVolumeFile("v.cfgx", "<volumeConfig><" + std::string(1 << 20, 'g') + "/></volumeConfig>");
  const RunResult longElement = convert("v", "v.cfgx");
  expectFailure(longElement, 1, {"v.cfgx:1: ", "unknown element <gggg"});
  EXPECT_LT(longElement.err.size(), 500u);

  // Entity expansion cannot start: the document type declaration is refused.
  std::string laughs = "<?xml version=\"1.0\"?>\n<!DOCTYPE v [<!ENTITY l0 \"ha\">";
  for (int i = 1; i < 12; ++i) {
    laughs += "<!ENTITY l" + std::to_string(i) + " \"";
    for (int k = 0; k < 10; ++k) laughs += "&l" + std::to_string(i - 1) + ";";
    laughs += "\">";
  }
  laughs += "]>\n<volumeConfig><global><volume>&l11;</volume></global></volumeConfig>\n";
  writeVolumeFile("v.cfgx", laughs);
  expectFailure(convert("v", "v.cfgx"), 1, {"document type declarations are not allowed"});

  // Key text beyond the limit, split by the parser into several pieces.
  writeVolumeFile("v.cfgx",
                  editedXml(3, "<global><volume>" + std::string(5000, 'v') + "</volume></global>"));
  expectFailure(convert("v", "v.cfgx"), 1, {"v.cfgx:3: ", "longer than 4096 bytes"});
}

}  // namespace
}  // namespace kolt
