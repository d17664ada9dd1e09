// End-to-end tests of the vx command: each runs the built program on a small collection made
// here (three families of near-duplicates, a 1 x 1 image, and files that must be skipped) and
// checks its output, its exit code and what it leaves in the database.
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <vips/vips.h>

#include <cstdlib>
#include <filesystem>
#include <iterator>
#include <regex>
#include <set>
#include <sstream>

#include "ImageDecoder.h"
#include "host_test_files.h"
#include "vxtest.h"

namespace fs = std::filesystem;
using namespace vxhost_test;

namespace {

struct Result {
  int exit = -1;
  std::string out, err;
};

// Quotes for the shell: every path here is generated, but a quote costs nothing.
std::string Quote(const std::string& text) {
  std::string quoted = "'";
  for (char c : text) quoted += c == '\'' ? std::string("'\\''") : std::string(1, c);
  return quoted + "'";
}

// Whether `text` contains `part`; on failure, shows the text.
testing::AssertionResult Has(const std::string& text, const std::string& part) {
  if (text.find(part) != std::string::npos) return testing::AssertionSuccess();
  return testing::AssertionFailure() << "no \"" << part << "\" in:\n" << text;
}

// The lines of `text`, without their line feeds.
std::vector<std::string> Lines(const std::string& text) {
  std::vector<std::string> lines;
  std::istringstream in(text);
  for (std::string line; std::getline(in, line);) lines.push_back(line);
  return lines;
}

// Red and green stripes that narrow to the right, a pattern no other family shares.
uint8_t RedStripes(int x, int y, int b) {
  const bool stripe = ((x * x / 640 + y / 3) / 24) % 2 == 0;
  return b == 0 ? (stripe ? 230 : 60) : b == 1 ? (stripe ? 40 : 160) : uint8_t(y / 4);
}

// Blue rings around a point left of the centre.
uint8_t BlueRings(int x, int y, int b) {
  const int dx = x - 240, dy = y - 220;
  const int ring = int(std::sqrt(double(dx * dx + dy * dy))) / 30 % 2;
  return b == 2 ? (ring ? 240 : 90) : b == 1 ? uint8_t(60 + ring * 80) : uint8_t(x / 8);
}

// Yellow squares on black.
uint8_t YellowChecks(int x, int y, int b) {
  const bool on = (x / 80 + y / 80) % 2 == 0;
  return b == 2 ? 10 : on ? uint8_t(250 - b * 20) : 15;
}

// Writes `op(source, args...)` to `path`; op is a libvips operation on one image.
template <typename Op, typename... Args>
void Derive(const std::string& source, const std::string& path, Op op, Args... args) {
  VipsImage* in = vips_image_new_from_file(source.c_str(), nullptr);
  ASSERT_NE(in, nullptr) << vips_error_buffer();
  VipsImage* out = nullptr;
  ASSERT_EQ(op(in, &out, args..., nullptr), 0) << vips_error_buffer();
  ASSERT_EQ(vips_image_write_to_file(out, path.c_str(), nullptr), 0) << vips_error_buffer();
  g_object_unref(out);
  g_object_unref(in);
}

class VxCommand : public ::testing::Test {
 protected:
  // The collection and its database are made once per process; ctest runs each test in a
  // process of its own, so no test depends on another.
  static void SetUpTestSuite() {
    dir_ = new vxtest::TempDir;
    vxhost::ImageDecoder::InitLibrary();
    for (const char* sub :
         {"photos/red", "photos/blue", "photos/yellow", "photos/odd", "outside"}) {
      fs::create_directories(P(sub));
    }
    const std::string red = P("photos/red/red.jpg"), blue = P("photos/blue/blue.jpg");
    SaveImage(red, 640, 480, 3, RedStripes);
    WriteRichMetadata(red);
    Derive(red, P("photos/red/red-half.png"), vips_resize, 0.5);
    Derive(red, P("photos/red/red-q20.jpg[Q=20]"), vips_copy);
    SaveImage(blue, 640, 480, 3, BlueRings);
    Derive(blue, P("photos/blue/blue-bright.jpg"), vips_linear1, 1.1, 15.0, "uchar", TRUE);
    Derive(blue, P("photos/blue/blue-crop.tif"), vips_crop, 32, 24, 576, 432);
    SaveImage(P("photos/yellow/yellow.png"), 640, 480, 3, YellowChecks);
    SaveImage(P("photos/odd/one.png"), 1, 1, 3, [](int, int, int b) { return uint8_t(90 + b); });
    const std::string jpeg = vxtest::ReadFile(blue);
    vxtest::WriteFile(P("photos/odd/corrupt.jpg"), jpeg.substr(0, jpeg.size() / 3));
    vxtest::WriteFile(P("photos/odd/empty.jpg"), "");
    vxtest::WriteFile(P("photos/odd/notes.jpg"), "a shopping list, not a picture\n");
    vxtest::WriteFile(P("photos/odd/huge.png"), ForgedHugePng());
    // An image outside the database: another crop of the red family.
    Derive(red, P("outside/red-part.jpg"), vips_crop, 40, 30, 560, 420);

    Result created = Vx("create " + Db());
    ASSERT_EQ(created.exit, 0) << created.err;
    imported_ = new Result(On("import", F("photos") + " --json"));
  }
  static void TearDownTestSuite() {
    delete imported_;
    delete dir_;
  }

  static std::string P(const std::string& name) { return *dir_ / name; }
  static std::string Db() { return Quote(P("photos.vxm")); }
  // The file's path, quoted, as a further argument.
  static std::string F(const std::string& name) { return " " + Quote(P(name)); }

  // Runs vx with `args` (already quoted), stdout and stderr captured apart.
  static Result Vx(const std::string& args) {
    const std::string out = P("out.txt"), err = P("err.txt");
    const std::string command =
        Quote(VX_PROGRAM) + " " + args + " >" + Quote(out) + " 2>" + Quote(err);
    const int status = std::system(command.c_str());
    return {WIFEXITED(status) ? WEXITSTATUS(status) : -1, vxtest::ReadFile(out),
            vxtest::ReadFile(err)};
  }
  // Runs `vx <command> <database><rest>`.
  static Result On(const std::string& command, const std::string& rest = "") {
    return Vx(command + " " + Db() + rest);
  }

  // The OID that `vx info` gives the file.
  static std::string OidOf(const std::string& path) {
    const std::string json = On("info", F(path) + " --json").out;
    std::smatch m;
    return std::regex_search(json, m, std::regex(R"("oid":(\d+))")) ? m[1].str() : "none";
  }

  static vxtest::TempDir* dir_;
  static Result* imported_;
};
vxtest::TempDir* VxCommand::dir_ = nullptr;
Result* VxCommand::imported_ = nullptr;

TEST_F(VxCommand, ImportSkipsBadFilesAndReimportsOnlyChanges) {
  ASSERT_EQ(imported_->exit, 0) << imported_->err;
  EXPECT_TRUE(Has(imported_->out, R"("imported":8,"updated":0,"unchanged":0,"skipped":4)"));
  // Each bad file is named with a reason; the good files of its folder are in.
  for (const char* bad : {"corrupt.jpg", "empty.jpg", "notes.jpg", "huge.png"}) {
    EXPECT_TRUE(Has(imported_->err, "skipped " + P("photos/odd/") + bad + ": "));
  }
  // Not a terminal: plain lines and a summary, no carriage returns.
  EXPECT_TRUE(Has(imported_->err, "import: 12 files in"));
  EXPECT_EQ(imported_->err.find('\r'), std::string::npos);

  Result again = On("import", F("photos") + " --json -q");
  EXPECT_TRUE(Has(again.out, R"("imported":0,"updated":0,"unchanged":8,"skipped":4)"));
  EXPECT_EQ(again.err.find("import:"), std::string::npos) << "quiet";

  // The same name with other content is updated under its OID, and nothing else changes.
  const std::string before = OidOf("photos/yellow/yellow.png");
  SaveImage(P("photos/yellow/yellow.png"), 320, 200, 3, YellowChecks);
  Result changed = On("import", F("photos") + " --json -q");
  EXPECT_TRUE(Has(changed.out, R"("imported":0,"updated":1,"unchanged":7,"skipped":4)"));
  Result info = On("info", F("photos/yellow/yellow.png") + " --json");
  EXPECT_TRUE(Has(info.out, "{\"file\":{\"oid\":" + before + ","));
  EXPECT_TRUE(Has(info.out, R"("width":320,"height":200)"));
}

TEST_F(VxCommand, InfoLsAndStatsShowWhatWasImported) {
  Result info = On("info", F("photos/red/red.jpg") + " --json");
  ASSERT_EQ(info.exit, 0) << info.err;
  // EXIF into the property table, the date taken into the record, XMP with rating and label,
  // tags into the full-text index. The EXIF orientation turns the image upright.
  for (const char* expected :
       {R"("width":480,"height":640)", R"("format":"jpeg")", R"("Make":"Canon")",
        R"("Model":"EOS 5D")", R"("ISO":"400")", R"("DateTaken":"2021-07-04 13:45:10")",
        R"("rating":4,"label":"Red")", R"("tag":"dc:subject","value":"Paris")"}) {
    EXPECT_TRUE(Has(info.out, expected));
  }
  EXPECT_EQ(info.out.find(R"("embeddedTime":null)"), std::string::npos);
  // A file without metadata has no date taken.
  Result plain = On("info", F("photos/odd/one.png") + " --json");
  EXPECT_TRUE(Has(plain.out, R"("width":1,"height":1)"));
  EXPECT_TRUE(Has(plain.out, R"("embeddedTime":null)"));

  std::vector<std::string> files = Lines(On("ls", F("photos/blue")).out);
  std::sort(files.begin(), files.end());
  EXPECT_EQ(files,
            (std::vector<std::string>{P("photos/blue/blue-bright.jpg"),
                                      P("photos/blue/blue-crop.tif"), P("photos/blue/blue.jpg")}));
  EXPECT_EQ(Lines(On("ls").out).size(), 8u);
  EXPECT_TRUE(Has(On("stats", " --json").out, R"({"files":8,"folders":5,)"));
}

TEST_F(VxCommand, SimilarRanksTheFamilyFirstFromInsideAndOutside) {
  Result byPath = On("similar", F("photos/red/red.jpg") + " --max 2");
  ASSERT_EQ(byPath.exit, 0) << byPath.err;
  // Two lines of score and path, best first.
  std::smatch m;
  ASSERT_TRUE(std::regex_match(byPath.out, m, std::regex(R"((\d+\.\d)\t(.*)\n(\d+\.\d)\t(.*)\n)")))
      << byPath.out;
  EXPECT_TRUE(std::stod(m[1]) <= 100 && std::stod(m[1]) >= std::stod(m[3])) << byPath.out;
  std::vector<std::string> paths{m[2], m[4]};
  std::sort(paths.begin(), paths.end());
  EXPECT_EQ(paths,
            (std::vector<std::string>{P("photos/red/red-half.png"), P("photos/red/red-q20.jpg")}));

  // By OID, and for a file that is not in the database.
  Result byOid =
      On("similar", " " + OidOf("photos/blue/blue.jpg") + " --method histogram --max 1 --json");
  EXPECT_TRUE(Has(byOid.out, R"("method":"histogram","results":[{"score":)"));
  EXPECT_TRUE(Has(byOid.out, P("photos/blue/blue-")));
  Result outside = On("similar", F("outside/red-part.jpg") + " --max 1");
  EXPECT_EQ(outside.exit, 0) << outside.err;
  EXPECT_TRUE(Has(outside.out, "\t" + P("photos/red/red")));

  // A minimum score above every hit leaves none.
  Result none = On("similar", F("photos/odd/one.png") + " --min-score 100");
  EXPECT_EQ(none.exit, 0);
  EXPECT_EQ(none.out, "");
}

TEST_F(VxCommand, DupesGroupsEachFamilyAndNothingElse) {
  Result dupes = On("dupes");
  ASSERT_EQ(dupes.exit, 0) << dupes.err;
  // One line per group, of tab-separated paths: the file names of each group, in any order.
  std::multiset<std::multiset<std::string>> groups;
  for (const std::string& line : Lines(dupes.out)) {
    std::istringstream names(std::regex_replace(line, std::regex("[^\t]*/"), ""));
    groups.insert({std::istream_iterator<std::string>(names), {}});
  }
  EXPECT_EQ(groups, (decltype(groups){{"blue-bright.jpg", "blue-crop.tif", "blue.jpg"},
                                      {"red-half.png", "red-q20.jpg", "red.jpg"}}))
      << dupes.out;

  Result json = On("dupes", " --method quick --rotate --min-score 99.9 --json");
  EXPECT_EQ(json.out.rfind(R"({"method":"quick","minScore":99.9,"groups":[)", 0), 0u) << json.out;
}

TEST_F(VxCommand, CategoriesByHandByFormulaAndByTag) {
  ASSERT_EQ(On("category add", " Trips").exit, 0);
  ASSERT_EQ(On("category add", " Alps --parent Trips").exit, 0);
  EXPECT_EQ(On("category add", " Alps --parent Trips").exit, 2) << "name taken";
  EXPECT_EQ(On("category add", " X --parent Nowhere").exit, 3);
  ASSERT_EQ(
      On("category assign", " Trips.Alps" + F("photos/red/red.jpg") + F("photos/blue/blue.jpg"))
          .exit,
      0);
  EXPECT_EQ(On("category assign", " Trips" + F("outside/red-part.jpg")).exit, 3);
  ASSERT_EQ(On("category add", " Reds").exit, 0);
  ASSERT_EQ(On("category assign", " Reds" + F("photos/red/red.jpg")).exit, 0);
  ASSERT_EQ(On("category add", " Cool").exit, 0);
  Result formula = On("category formula", " Cool '\"Trips.Alps\" NOT \"Reds\"'");
  ASSERT_EQ(formula.exit, 0) << formula.err;
  EXPECT_EQ(On("category files", " Cool").out, P("photos/blue/blue.jpg") + "\n");
  EXPECT_EQ(On("ls", " --category Reds").out, P("photos/red/red.jpg") + "\n");
  Result bad = On("category formula", " Cool '\"Trips\" AND NOT \"Reds\"'");
  EXPECT_EQ(bad.exit, 2);
  EXPECT_TRUE(Has(bad.err, "formula error 150"));

  // Taken away by hand, the file leaves the formula's result as well.
  ASSERT_EQ(On("category assign", " Trips.Alps --remove" + F("photos/blue/blue.jpg")).exit, 0);
  EXPECT_EQ(On("category files", " Cool").out, "");

  // A category driven by a tag lists the values of the full-text index with the files that
  // carry each: the red family, whose derived copies kept their metadata.
  ASSERT_EQ(On("category add", " Subjects --tag dc:subject").exit, 0);
  Result tree = On("category tree");
  for (const char* part : {"Subjects", "  = Paris (3)\n", "Alps (1)"}) {
    EXPECT_TRUE(Has(tree.out, part));
  }
}

// Exit codes: 1 for a database or image that cannot be used, 2 for bad arguments, 3 for what is
// not in the database; an existing database is never created over.
TEST_F(VxCommand, EveryCommandHasHelpAndBadInputHasItsExitCode) {
  EXPECT_EQ(Vx("").exit, 2);
  EXPECT_EQ(Vx("frobnicate").exit, 2);
  EXPECT_EQ(On("create").exit, 1);
  EXPECT_EQ(Vx("stats " + Quote(P("missing.vxm"))).exit, 1);
  EXPECT_EQ(On("import", F("no-such-folder")).exit, 2);
  EXPECT_EQ(On("info", F("photos/odd/empty.jpg")).exit, 3);
  EXPECT_EQ(On("ls", F("outside")).exit, 3);
  EXPECT_EQ(On("similar", F("photos/odd/notes.jpg")).exit, 1);
  EXPECT_EQ(On("similar", F("nothing.jpg")).exit, 3);
  EXPECT_EQ(On("similar", " 1 --method nearest").exit, 2);
  for (const char* command :
       {"", "create", "import", "similar", "dupes", "ls", "info", "stats", "category",
        "category add", "category formula", "category assign", "category files", "category tree"}) {
    Result help = Vx(std::string(command) + " --help");
    EXPECT_EQ(help.exit, 0) << command;
    EXPECT_TRUE(Has(help.out, "Usage:")) << command;
  }
}

// The report is one self-contained file: opened by a headless browser with no network, it must
// show the thumbnails. The screenshot is kept beside the test's binary for a person to look at.
TEST_F(VxCommand, HtmlReportRendersInABrowser) {
  const std::string page = P("dupes.html");
  Result dupes = On("dupes", " --html " + Quote(page));
  ASSERT_EQ(dupes.exit, 0) << dupes.err;
  EXPECT_TRUE(Has(dupes.err, "report written to " + page));
  const std::string html = vxtest::ReadFile(page);
  EXPECT_EQ(html.find("src=\"file:"), std::string::npos);
  EXPECT_EQ(html.find("src=\"http"), std::string::npos);

  const std::string shot = fs::read_symlink("/proc/self/exe").parent_path() / "vx_report.png";
  fs::remove(shot);
  const std::string command =
      "chromium --headless --no-sandbox --disable-gpu --disable-quic --no-first-run "
      "--disable-background-networking --disable-component-update --disable-sync "
      "--window-size=1000,800 --enable-logging=stderr --user-data-dir=" +
      Quote(P("chromium")) + " --screenshot=" + Quote(shot) + " " + Quote("file://" + page) + " >" +
      Quote(P("chromium.log")) + " 2>&1";
  ASSERT_EQ(std::system(command.c_str()), 0) << vxtest::ReadFile(P("chromium.log"));
  const std::string log = vxtest::ReadFile(P("chromium.log"));
  EXPECT_EQ(log.find(":CONSOLE("), std::string::npos) << log;

  // The red family's thumbnails are the only strongly red pixels the page can show.
  VipsImage* image =
      vips_image_new_from_file(shot.c_str(), "access", VIPS_ACCESS_SEQUENTIAL, nullptr);
  ASSERT_NE(image, nullptr) << vips_error_buffer();
  size_t size = 0;
  auto* pixels = static_cast<uint8_t*>(vips_image_write_to_memory(image, &size));
  const int bands = image->Bands;
  size_t red = 0;
  for (size_t i = 0; i + 2 < size; i += bands) {
    red += pixels[i] > 180 && pixels[i + 1] < 90 && pixels[i + 2] < 130;
  }
  g_free(pixels);
  g_object_unref(image);
  EXPECT_GT(red, 2000u) << "no thumbnail of the red family in " << shot;
}

}  // namespace
