// End-to-end tests of the vx command: each runs the built program on a small collection made
// here (three families of near-duplicates, a 1 x 1 image, and files that must be skipped) and
// checks its output, its exit code and what it leaves in the database.
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <vips/vips.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <regex>
#include <sstream>

#include "ImageDecoder.h"
#include "host_test_files.h"
#include "vxtest.h"

namespace fs = std::filesystem;
using namespace vxhost_test;

namespace {

struct Result {
  int exit = -1;
  std::string out;
  std::string err;
};

// Quotes for the shell: every path here is generated, but a quote costs nothing.
std::string Quote(const std::string& text) {
  std::string quoted = "'";
  for (char c : text) quoted += c == '\'' ? std::string("'\\''") : std::string(1, c);
  return quoted + "'";
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

// Writes `op(source)` to `path`; op is a libvips operation on one image.
template <typename Op>
void Derive(const std::string& source, const std::string& path, Op op) {
  VipsImage* in = vips_image_new_from_file(source.c_str(), nullptr);
  ASSERT_NE(in, nullptr) << vips_error_buffer();
  VipsImage* out = nullptr;
  ASSERT_EQ(op(in, &out), 0) << vips_error_buffer();
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
    SaveImage(P("photos/red/red.jpg"), 640, 480, 3, RedStripes);
    WriteRichMetadata(P("photos/red/red.jpg"));
    Derive(P("photos/red/red.jpg"), P("photos/red/red-half.png"),
           [](VipsImage* in, VipsImage** out) { return vips_resize(in, out, 0.5, nullptr); });
    Derive(P("photos/red/red.jpg"), P("photos/red/red-q20.jpg[Q=20]"),
           [](VipsImage* in, VipsImage** out) { return vips_copy(in, out, nullptr); });
    SaveImage(P("photos/blue/blue.jpg"), 640, 480, 3, BlueRings);
    Derive(P("photos/blue/blue.jpg"), P("photos/blue/blue-bright.jpg"),
           [](VipsImage* in, VipsImage** out) {
             return vips_linear1(in, out, 1.1, 15, "uchar", TRUE, nullptr);
           });
    Derive(P("photos/blue/blue.jpg"), P("photos/blue/blue-crop.tif"),
           [](VipsImage* in, VipsImage** out) {
             return vips_crop(in, out, 32, 24, 576, 432, nullptr);
           });
    SaveImage(P("photos/yellow/yellow.png"), 640, 480, 3, YellowChecks);
    SaveImage(P("photos/odd/one.png"), 1, 1, 3, [](int, int, int b) { return uint8_t(90 + b); });
    const std::string jpeg = vxtest::ReadFile(P("photos/blue/blue.jpg"));
    vxtest::WriteFile(P("photos/odd/corrupt.jpg"), jpeg.substr(0, jpeg.size() / 3));
    vxtest::WriteFile(P("photos/odd/empty.jpg"), "");
    vxtest::WriteFile(P("photos/odd/notes.jpg"), "a shopping list, not a picture\n");
    vxtest::WriteFile(P("photos/odd/huge.png"), ForgedHugePng());
    // An image outside the database: another crop of the red family.
    Derive(P("photos/red/red.jpg"), P("outside/red-part.jpg"), [](VipsImage* in, VipsImage** out) {
      return vips_crop(in, out, 40, 30, 560, 420, nullptr);
    });

    Result created = Vx("create " + Db());
    ASSERT_EQ(created.exit, 0) << created.err;
    imported_ = new Result(Vx("import " + Db() + " " + Quote(P("photos")) + " --json"));
  }
  static void TearDownTestSuite() {
    delete imported_;
    delete dir_;
  }

  static std::string P(const std::string& name) { return *dir_ / name; }
  static std::string Db() { return Quote(P("photos.vxm")); }

  // Runs vx with `args` (already quoted), stdout and stderr captured apart.
  static Result Vx(const std::string& args) {
    const std::string out = P("out.txt"), err = P("err.txt");
    const std::string command =
        Quote(VX_PROGRAM) + " " + args + " >" + Quote(out) + " 2>" + Quote(err);
    const int status = std::system(command.c_str());
    Result r;
    r.exit = WIFEXITED(status) ? WEXITSTATUS(status) : -1;
    r.out = vxtest::ReadFile(out);
    r.err = vxtest::ReadFile(err);
    return r;
  }

  // The OID that `vx info` gives the file.
  static std::string OidOf(const std::string& path) {
    const std::string json = Vx("info " + Db() + " " + Quote(P(path)) + " --json").out;
    std::smatch m;
    return std::regex_search(json, m, std::regex(R"("oid":(\d+))")) ? m[1].str() : "none";
  }

  // The lines of `text`, without their line feeds.
  static std::vector<std::string> Lines(const std::string& text) {
    std::vector<std::string> lines;
    std::istringstream in(text);
    for (std::string line; std::getline(in, line);) lines.push_back(line);
    return lines;
  }

  static vxtest::TempDir* dir_;
  static Result* imported_;
};
vxtest::TempDir* VxCommand::dir_ = nullptr;
Result* VxCommand::imported_ = nullptr;

TEST_F(VxCommand, ImportSkipsBadFilesAndReimportsOnlyChanges) {
  ASSERT_EQ(imported_->exit, 0) << imported_->err;
  EXPECT_NE(imported_->out.find(R"("imported":8,"updated":0,"unchanged":0,"skipped":4)"),
            std::string::npos)
      << imported_->out;
  // Each bad file is named with a reason; the good files of its folder are in.
  for (const char* bad : {"corrupt.jpg", "empty.jpg", "notes.jpg", "huge.png"}) {
    EXPECT_NE(imported_->err.find("skipped " + P("photos/odd/") + bad + ": "), std::string::npos)
        << bad << "\n"
        << imported_->err;
  }
  // Not a terminal: plain lines and a summary, no carriage returns.
  EXPECT_NE(imported_->err.find("import: 12 files in"), std::string::npos) << imported_->err;
  EXPECT_EQ(imported_->err.find('\r'), std::string::npos);

  Result again = Vx("import " + Db() + " " + Quote(P("photos")) + " --json -q");
  EXPECT_NE(again.out.find(R"("imported":0,"updated":0,"unchanged":8,"skipped":4)"),
            std::string::npos)
      << again.out;
  EXPECT_EQ(again.err.find("import:"), std::string::npos) << "quiet";

  // The same name with other content is updated under its OID, and nothing else changes.
  const std::string before = OidOf("photos/yellow/yellow.png");
  SaveImage(P("photos/yellow/yellow.png"), 320, 200, 3, YellowChecks);
  Result changed = Vx("import " + Db() + " " + Quote(P("photos")) + " --json -q");
  EXPECT_NE(changed.out.find(R"("imported":0,"updated":1,"unchanged":7,"skipped":4)"),
            std::string::npos)
      << changed.out;
  Result info = Vx("info " + Db() + " " + Quote(P("photos/yellow/yellow.png")) + " --json");
  EXPECT_NE(info.out.find("{\"file\":{\"oid\":" + before + ","), std::string::npos);
  EXPECT_NE(info.out.find(R"("width":320,"height":200)"), std::string::npos) << info.out;

  EXPECT_EQ(Vx("import " + Db() + " " + Quote(P("no-such-folder"))).exit, 2);
  EXPECT_EQ(Vx("create " + Db()).exit, 1) << "an existing database is kept";
}

TEST_F(VxCommand, InfoLsAndStatsShowWhatWasImported) {
  Result info = Vx("info " + Db() + " " + Quote(P("photos/red/red.jpg")) + " --json");
  ASSERT_EQ(info.exit, 0) << info.err;
  // EXIF into the property table, the date taken into the record, XMP with rating and label,
  // tags into the full-text index. The EXIF orientation turns the image upright.
  for (const char* expected :
       {R"("width":480,"height":640)", R"("format":"jpeg")", R"("Make":"Canon")",
        R"("Model":"EOS 5D")", R"("ISO":"400")", R"("DateTaken":"2021-07-04 13:45:10")",
        R"("rating":4,"label":"Red")", R"("tag":"dc:subject","value":"Paris")"}) {
    EXPECT_NE(info.out.find(expected), std::string::npos) << expected << "\n" << info.out;
  }
  EXPECT_EQ(info.out.find(R"("embeddedTime":null)"), std::string::npos);
  // A file without metadata has no date taken.
  Result plain = Vx("info " + Db() + " " + Quote(P("photos/odd/one.png")) + " --json");
  EXPECT_NE(plain.out.find(R"("width":1,"height":1)"), std::string::npos) << plain.out;
  EXPECT_NE(plain.out.find(R"("embeddedTime":null)"), std::string::npos) << plain.out;

  Result folder = Vx("ls " + Db() + " " + Quote(P("photos/blue")));
  std::vector<std::string> files = Lines(folder.out);
  std::sort(files.begin(), files.end());
  EXPECT_EQ(files,
            (std::vector<std::string>{P("photos/blue/blue-bright.jpg"),
                                      P("photos/blue/blue-crop.tif"), P("photos/blue/blue.jpg")}));
  EXPECT_EQ(Lines(Vx("ls " + Db()).out).size(), 8u);
  Result stats = Vx("stats " + Db() + " --json");
  EXPECT_NE(stats.out.find(R"({"files":8,"folders":5,)"), std::string::npos) << stats.out;

  EXPECT_EQ(Vx("info " + Db() + " " + Quote(P("photos/odd/empty.jpg"))).exit, 3);
  EXPECT_EQ(Vx("ls " + Db() + " " + Quote(P("outside"))).exit, 3);
  EXPECT_EQ(Vx("stats " + Quote(P("missing.vxm"))).exit, 1);
}

TEST_F(VxCommand, SimilarRanksTheFamilyFirstFromInsideAndOutside) {
  Result byPath = Vx("similar " + Db() + " " + Quote(P("photos/red/red.jpg")) + " --max 2");
  ASSERT_EQ(byPath.exit, 0) << byPath.err;
  std::vector<std::string> lines = Lines(byPath.out);
  ASSERT_EQ(lines.size(), 2u) << byPath.out;
  const std::regex line(R"((\d+\.\d)\t(.*))");
  std::vector<std::string> paths;
  double previous = 101;
  for (const std::string& l : lines) {
    std::smatch m;
    ASSERT_TRUE(std::regex_match(l, m, line)) << l;
    EXPECT_LE(std::stod(m[1]), previous) << "ranked";
    previous = std::stod(m[1]);
    paths.push_back(m[2]);
  }
  std::sort(paths.begin(), paths.end());
  EXPECT_EQ(paths,
            (std::vector<std::string>{P("photos/red/red-half.png"), P("photos/red/red-q20.jpg")}));

  // By OID, and for a file that is not in the database.
  const std::string oid = OidOf("photos/blue/blue.jpg");
  Result byOid = Vx("similar " + Db() + " " + oid + " --method histogram --max 1 --json");
  EXPECT_NE(byOid.out.find(R"("method":"histogram","results":[{"score":)"), std::string::npos);
  EXPECT_NE(byOid.out.find(P("photos/blue/blue-")), std::string::npos) << byOid.out;
  Result outside = Vx("similar " + Db() + " " + Quote(P("outside/red-part.jpg")) + " --max 1");
  EXPECT_EQ(outside.exit, 0) << outside.err;
  EXPECT_NE(outside.out.find("\t" + P("photos/red/red")), std::string::npos) << outside.out;

  // A minimum score above every hit leaves none.
  Result none = Vx("similar " + Db() + " " + Quote(P("photos/odd/one.png")) + " --min-score 100");
  EXPECT_EQ(none.exit, 0);
  EXPECT_EQ(none.out, "");
  EXPECT_EQ(Vx("similar " + Db() + " " + Quote(P("photos/odd/notes.jpg"))).exit, 1);
  EXPECT_EQ(Vx("similar " + Db() + " " + Quote(P("nothing.jpg"))).exit, 3);
  EXPECT_EQ(Vx("similar " + Db() + " 1 --method nearest").exit, 2);
}

TEST_F(VxCommand, DupesGroupsEachFamilyAndNothingElse) {
  Result dupes = Vx("dupes " + Db());
  ASSERT_EQ(dupes.exit, 0) << dupes.err;
  std::vector<std::string> groups;
  for (const std::string& line : Lines(dupes.out)) {
    std::vector<std::string> files;
    std::istringstream fields(line);
    for (std::string f; std::getline(fields, f, '\t');) files.push_back(f);
    std::sort(files.begin(), files.end());
    std::string joined;
    for (const std::string& f : files) joined += fs::path(f).filename().string() + " ";
    groups.push_back(joined);
  }
  std::sort(groups.begin(), groups.end());
  EXPECT_EQ(groups, (std::vector<std::string>{"blue-bright.jpg blue-crop.tif blue.jpg ",
                                              "red-half.png red-q20.jpg red.jpg "}))
      << dupes.out;

  Result json = Vx("dupes " + Db() + " --method quick --rotate --min-score 99.9 --json");
  EXPECT_EQ(json.out.rfind(R"({"method":"quick","minScore":99.9,"groups":[)", 0), 0u) << json.out;
}

TEST_F(VxCommand, CategoriesByHandByFormulaAndByTag) {
  ASSERT_EQ(Vx("category add " + Db() + " Trips").exit, 0);
  ASSERT_EQ(Vx("category add " + Db() + " Alps --parent Trips").exit, 0);
  EXPECT_EQ(Vx("category add " + Db() + " Alps --parent Trips").exit, 2) << "name taken";
  EXPECT_EQ(Vx("category add " + Db() + " X --parent Nowhere").exit, 3);
  ASSERT_EQ(Vx("category assign " + Db() + " Trips.Alps " + Quote(P("photos/red/red.jpg")) + " " +
               Quote(P("photos/blue/blue.jpg")))
                .exit,
            0);
  EXPECT_EQ(Vx("category assign " + Db() + " Trips " + Quote(P("outside/red-part.jpg"))).exit, 3);
  ASSERT_EQ(Vx("category add " + Db() + " Reds").exit, 0);
  ASSERT_EQ(Vx("category assign " + Db() + " Reds " + Quote(P("photos/red/red.jpg"))).exit, 0);
  ASSERT_EQ(Vx("category add " + Db() + " Cool").exit, 0);
  Result formula = Vx("category formula " + Db() + " Cool '\"Trips.Alps\" NOT \"Reds\"'");
  ASSERT_EQ(formula.exit, 0) << formula.err;
  EXPECT_EQ(Vx("category files " + Db() + " Cool").out, P("photos/blue/blue.jpg") + "\n");
  EXPECT_EQ(Vx("ls " + Db() + " --category Reds").out, P("photos/red/red.jpg") + "\n");
  Result bad = Vx("category formula " + Db() + " Cool '\"Trips\" AND NOT \"Reds\"'");
  EXPECT_EQ(bad.exit, 2);
  EXPECT_NE(bad.err.find("formula error 150"), std::string::npos) << bad.err;

  // Taken away by hand, the file leaves the formula's result as well.
  ASSERT_EQ(
      Vx("category assign " + Db() + " Trips.Alps --remove " + Quote(P("photos/blue/blue.jpg")))
          .exit,
      0);
  EXPECT_EQ(Vx("category files " + Db() + " Cool").out, "");

  // A category driven by a tag lists the values of the full-text index with the files that
  // carry each: the red family, whose derived copies kept their metadata.
  ASSERT_EQ(Vx("category add " + Db() + " Subjects --tag dc:subject").exit, 0);
  Result tree = Vx("category tree " + Db());
  EXPECT_NE(tree.out.find("Subjects"), std::string::npos) << tree.out;
  EXPECT_NE(tree.out.find("  = Paris (3)\n"), std::string::npos) << tree.out;
  EXPECT_NE(tree.out.find("Alps (1)"), std::string::npos) << tree.out;
}

TEST_F(VxCommand, EveryCommandHasHelp) {
  for (const char* command :
       {"", "create", "import", "similar", "dupes", "ls", "info", "stats", "category",
        "category add", "category formula", "category assign", "category files", "category tree"}) {
    Result help = Vx(std::string(command) + " --help");
    EXPECT_EQ(help.exit, 0) << command;
    EXPECT_NE(help.out.find("Usage:"), std::string::npos) << command;
  }
  EXPECT_EQ(Vx("").exit, 2);
  EXPECT_EQ(Vx("frobnicate").exit, 2);
}

// The report is one self-contained file: opened by a headless browser with no network, it must
// show the thumbnails. The screenshot is kept beside the test's binary for a person to look at.
TEST_F(VxCommand, HtmlReportRendersInABrowser) {
  const std::string page = P("dupes.html");
  Result dupes = Vx("dupes " + Db() + " --html " + Quote(page));
  ASSERT_EQ(dupes.exit, 0) << dupes.err;
  EXPECT_NE(dupes.err.find("report written to " + page), std::string::npos) << dupes.err;
  const std::string html = vxtest::ReadFile(page);
  EXPECT_EQ(html.find("src=\"file:"), std::string::npos);
  EXPECT_EQ(html.find("src=\"http"), std::string::npos);

  const std::string shot = fs::read_symlink("/proc/self/exe").parent_path() / "vx_report.png";
  fs::remove(shot);
  const std::string command =
      "chromium --headless --no-sandbox --disable-gpu --disable-quic --no-first-run "
      "--disable-background-networking --disable-component-update --disable-sync "
      "--user-data-dir=" +
      Quote(P("chromium")) + " --window-size=1000,800 --screenshot=" + Quote(shot) +
      " --enable-logging=stderr " + Quote("file://" + page) + " >" + Quote(P("chromium.log")) +
      " 2>&1";
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
    if (pixels[i] > 180 && pixels[i + 1] < 90 && pixels[i + 2] < 130) ++red;
  }
  g_free(pixels);
  g_object_unref(image);
  EXPECT_GT(red, 2000u) << "no thumbnail of the red family in " << shot;
}

}  // namespace
