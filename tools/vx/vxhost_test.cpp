// Tests of the vx host's building blocks against a small collection of files generated here:
// good images, damaged and forged ones, a folder tree with a link loop.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>
#include <zlib.h>

#include <vxcore3/vxcore3.h>
#include <exiv2/exiv2.hpp>

#include <cmath>
#include <ctime>
#include <filesystem>
#include <sstream>
#include <thread>

#include "FileCrc.h"
#include "FolderWalk.h"
#include "HtmlReport.h"
#include "ImageDecoder.h"
#include "JsonWriter.h"
#include "Metadata.h"
#include "Progress.h"
#include "host_test_files.h"
#include "vxtest.h"

using namespace vxhost;
using namespace vxhost_test;
namespace fs = std::filesystem;

namespace {

class HostFiles : public ::testing::Test {
 protected:
  static void SetUpTestSuite() {
    dir_ = new vxtest::TempDir;
    SaveImage(P("photo.jpg"), 640, 480, 3, Gradient);
    SaveImage(P("alpha.png"), 30, 20, 4,
              [](int x, int, int b) { return uint8_t(b == 3 ? x * 8 : b * 100); });
    SaveImage(P("grey.png"), 50, 40, 1, [](int x, int y, int) { return uint8_t(x + y); });
    SaveImage(P("tiny.png"), 1, 1, 3, [](int, int, int b) { return uint8_t(10 + b); });
    SaveDeepGrey(P("deep.png"));
    // Left half red; shown turned a quarter clockwise, the red half is on top.
    SaveImage(
        P("turned.tif"), 60, 40, 3,
        [](int x, int, int b) { return uint8_t(b == 0 && x < 30 ? 255 : 0); }, 6);
    std::string jpeg = vxtest::ReadFile(P("photo.jpg"));
    vxtest::WriteFile(P("corrupt.jpg"), jpeg.substr(0, jpeg.size() / 3));
    vxtest::WriteFile(P("empty.jpg"), "");
    vxtest::WriteFile(P("text.jpg"), "just some text, no image\n");
    vxtest::WriteFile(P("huge.png"), ForgedHugePng());
  }
  static void TearDownTestSuite() { delete dir_; }
  static std::string P(const std::string& name) { return *dir_ / name; }

  static vxtest::TempDir* dir_;
};
vxtest::TempDir* HostFiles::dir_ = nullptr;

DecodedImage MustDecode(const std::string& path, DecodeOptions options = {}) {
  DecodedImage image;
  HostStatus st = ImageDecoder(options).Decode(path, &image);
  EXPECT_TRUE(st.ok()) << st.ToString();
  return image;
}

// Pixel size, header size and format of a decoded image.
auto Shape(const DecodedImage& d) {
  return std::tuple(d.width, d.height, d.info.width, d.info.height, d.info.format);
}

using Px = std::vector<uint8_t>;
// The RGBA values of pixel `i`; throws, failing the test, when the image has fewer pixels.
Px PixelAt(const DecodedImage& d, size_t i) {
  (void)d.pixels.at(i * 4 + 3);
  return Px(d.pixels.begin() + i * 4, d.pixels.begin() + i * 4 + 4);
}

// Whether `text` contains `part`; on failure, shows the text.
testing::AssertionResult Has(const std::string& text, const std::string& part) {
  if (text.find(part) != std::string::npos) return testing::AssertionSuccess();
  return testing::AssertionFailure() << "no \"" << part << "\" in:\n" << text;
}

TEST_F(HostFiles, DecodesShrunkSRGBAWithHeaderFacts) {
  DecodedImage jpeg = MustDecode(P("photo.jpg"), {.maxSide = 100});
  EXPECT_EQ(Shape(jpeg), std::tuple(100u, 75u, 640u, 480u, kFormatJpeg));
  EXPECT_EQ(std::tuple(jpeg.info.loader, jpeg.grayScale), std::tuple("jpegload", false));
  Px last = PixelAt(jpeg, 100 * 75 - 1);  // bottom right: red and green high
  EXPECT_TRUE(last[0] > 230 && last[1] > 230 && std::abs(last[2] - 128) <= 8 && last[3] == 255)
      << testing::PrintToString(last);

  DecodedImage alpha = MustDecode(P("alpha.png"));  // small images are not enlarged
  EXPECT_EQ(Shape(alpha), std::tuple(30u, 20u, 30u, 20u, kFormatPng));
  EXPECT_EQ(std::tuple(alpha.pixels[3], alpha.pixels[29 * 4 + 3]), std::tuple(0, 29 * 8));

  DecodedImage grey = MustDecode(P("grey.png"));
  EXPECT_TRUE(grey.grayScale && grey.info.grayScale);
  EXPECT_EQ(PixelAt(grey, 5 * 50 + 7), (Px{12, 12, 12, 255}));
  DecodedImage deep = MustDecode(P("deep.png"));  // scaled to 8 bits, not clipped
  EXPECT_TRUE(deep.grayScale);
  EXPECT_EQ(PixelAt(deep, 0), (Px{128, 128, 128, 255}));

  // A streamed loader (no shrink on load) turns the shrunk image upright: the red half on top.
  DecodedImage turned = MustDecode(P("turned.tif"), {.maxSide = 30});
  EXPECT_EQ(Shape(turned), std::tuple(20u, 30u, 40u, 60u, kFormatTiff));
  EXPECT_EQ(std::tuple(PixelAt(turned, 0)[0], PixelAt(turned, 20 * 30 - 1)[0]), std::tuple(255, 0));

  EXPECT_EQ(MustDecode(P("tiny.png")).pixels, (Px{10, 11, 12, 255}));
}

TEST_F(HostFiles, BadFilesGiveStatusesNotCrashes) {
  ImageDecoder decoder;
  DecodedImage image;
  EXPECT_EQ(decoder.Decode(P("corrupt.jpg"), &image).code(), HostStatus::kCorrupt);
  EXPECT_TRUE(image.pixels.empty());
  EXPECT_EQ(decoder.Decode(P("empty.jpg"), &image).code(), HostStatus::kUnsupported);
  EXPECT_EQ(decoder.Decode(P("text.jpg"), &image).code(), HostStatus::kUnsupported);
  EXPECT_EQ(decoder.Decode(P("missing.jpg"), &image).code(), HostStatus::kIoError);
  EXPECT_EQ(decoder.Decode(dir_->path().string(), &image).code(), HostStatus::kIoError);

  HostStatus huge = decoder.Decode(P("huge.png"), &image);
  EXPECT_EQ(huge.code(), HostStatus::kTooLarge);
  EXPECT_TRUE(Has(huge.message(), "20000x20000"));
  EXPECT_EQ(image.info.width, 20000u);  // the header is still reported
  // Without the limit the forged file fails in decoding, it does not allocate 1.2 GB.
  DecodeOptions unlimited{.maxPixels = UINT64_MAX};
  EXPECT_EQ(ImageDecoder(unlimited).Decode(P("huge.png"), &image).code(), HostStatus::kCorrupt);
}

TEST_F(HostFiles, ConcurrentDecodesAgree) {
  ImageDecoder decoder({.maxSide = 64});
  const std::vector<std::string> names = {"photo.jpg", "grey.png", "corrupt.jpg", "text.jpg"};
  std::atomic<int> wrong{0};
  std::vector<std::thread> threads(4);
  for (auto& t : threads) {
    t = std::thread([&] {
      for (size_t k = 0; k < 5 * names.size(); ++k) {
        const size_t i = k % names.size();
        DecodedImage image;
        bool ok = decoder.Decode(P(names[i]), &image).ok();
        wrong += ok != (i < 2) || (ok && image.pixels.size() != image.width * image.height * 4);
      }
    });
  }
  for (auto& t : threads) t.join();
  EXPECT_EQ(wrong.load(), 0);
}

TEST_F(HostFiles, JpegThumbnailFitsTheBoxAndBitmapCopies) {
  DecodedImage in = MustDecode(P("photo.jpg"), {.maxSide = 400});
  EncodedJpeg thumb;
  ASSERT_TRUE(
      EncodeJpegThumbnail(in.pixels.data(), in.width, in.height, 160, 160, 85, &thumb).ok());
  EXPECT_EQ(std::tuple(thumb.width, thumb.height), std::tuple(160u, 120u));
  vxtest::WriteFile(P("thumb.jpg"), std::string(thumb.bytes.begin(), thumb.bytes.end()));
  EXPECT_EQ(Shape(MustDecode(P("thumb.jpg"))), std::tuple(160u, 120u, 160u, 120u, kFormatJpeg));

  const std::vector<uint8_t> clear(8 * 8 * 4, 0);  // transparent black turns white
  ASSERT_TRUE(EncodeJpegThumbnail(clear.data(), 8, 8, 16, 16, 90, &thumb).ok());
  vxtest::WriteFile(P("white.jpg"), std::string(thumb.bytes.begin(), thumb.bytes.end()));
  EXPECT_GT(PixelAt(MustDecode(P("white.jpg")), 0)[0], 250);

  const uint8_t one[4] = {1, 2, 3, 4};
  ASSERT_TRUE(EncodeJpegThumbnail(one, 1, 1, 160, 100, 500, &thumb).ok());
  EXPECT_EQ(thumb.width, 1u);
  EXPECT_EQ(EncodeJpegThumbnail(nullptr, 1, 1, 16, 16, 80, &thumb).code(),
            HostStatus::kInvalidInput);
  EXPECT_EQ(EncodeJpegThumbnail(one, 1, 1, 0, 16, 80, &thumb).code(), HostStatus::kInvalidInput);
  EXPECT_TRUE(thumb.bytes.empty());

  CVXBitmap bitmap;
  DecodedImage grey = MustDecode(P("grey.png"));
  ASSERT_EQ(FillBitmap(grey, &bitmap), unsigned{VX_OK});
  EXPECT_EQ(std::tuple(bitmap.GetWidth(), bitmap.GetHeight(), bitmap.IsGrayScale()),
            std::tuple(50u, 40u, true));
  EXPECT_EQ(0, std::memcmp(bitmap.GetData(), grey.pixels.data(), grey.pixels.size()));
  EXPECT_EQ(FillBitmap(DecodedImage(), &bitmap), unsigned{VX_NEUTRAL_FAILURE});
  EXPECT_EQ(bitmap.GetWidth(), 0u);
}

TEST(HostFormat, NamesAndLoaders) {
  EXPECT_EQ(FormatFromFileName("/a.b/IMG_1.JPEG"), kFormatJpeg);
  EXPECT_EQ(FormatFromFileName("x.HeIc"), kFormatHeif);
  EXPECT_EQ(FormatFromFileName("a.jpg/readme"), kFormatUnknown);
  EXPECT_EQ(FormatFromFileName("jpg"), kFormatUnknown);
  EXPECT_EQ(FormatFromLoader("pngload_source"), kFormatPng);
  EXPECT_EQ(FormatFromLoader("magickload"), kFormatOther);
  EXPECT_EQ(FormatFromLoader(""), kFormatUnknown);
  EXPECT_STREQ(FormatName(kFormatWebp), "webp");
  EXPECT_STREQ(FormatName(99), "unknown");
}

TEST_F(HostFiles, MetadataRoundTrip) {
  std::string path = P("tagged.jpg");
  fs::copy_file(P("photo.jpg"), path, fs::copy_options::overwrite_existing);
  WriteRichMetadata(path);
  ImageMetadata m;
  HostStatus st = MetadataReader::Read(path, &m);
  ASSERT_TRUE(st.ok()) << st.ToString();
  // DateTimeOriginal wins; IPTC gives the country, which the XMP lacks.
  EXPECT_EQ(std::vector({m.make, m.model, m.lens, m.artist, m.title, m.city, m.country, m.label,
                         m.dateTakenText, m.exposureText}),
            std::vector<std::string>({"Canon", "EOS 5D", "EF50mm f/1.8", "A. Painter", "Eiffel",
                                      "Paris", "France", "Red", "2021-07-04T13:45:10", "1/250"}));
  std::tm tm{};
  tm.tm_year = 121, tm.tm_mon = 6, tm.tm_mday = 4;
  tm.tm_hour = 13, tm.tm_min = 45, tm.tm_sec = 10, tm.tm_isdst = -1;
  EXPECT_TRUE(m.hasDateTaken && m.hasGps);
  EXPECT_EQ(m.dateTaken, int64_t(std::mktime(&tm)));  // in local time
  EXPECT_EQ(std::tuple(m.iso, m.orientation, m.width, m.rating), std::tuple(400u, 6, 640u, 4));
  EXPECT_EQ(std::tuple(m.exposureTime, m.fNumber, m.focalLength), std::tuple(0.004, 2.8, 50.0));
  EXPECT_NEAR(m.latitude, -(48 + 51 / 60.0 + 30 / 3600.0), 1e-9);
  EXPECT_NEAR(m.longitude, 2 + 17 / 60.0 + 40 / 3600.0, 1e-9);
  EXPECT_EQ(m.keywords, (std::vector<std::string>{"Paris", "tower", "night"}));
  EXPECT_TRUE(Has(m.xmpPacket, "Eiffel"));

  // The full-text records: the subjects and the title first, then the other fields.
  std::vector<std::string> records;
  for (const auto& r : m.FullTextRecords()) records.push_back(r.Tag + "=" + r.Value);
  ASSERT_GE(records.size(), 4u);
  EXPECT_EQ(std::vector(records.begin(), records.begin() + 4),
            (std::vector<std::string>{"dc:subject=Paris", "dc:subject=tower", "dc:subject=night",
                                      "dc:title=Eiffel"}));
  for (const char* r : {"photoshop:City=Paris", "tiff:Make=Canon", "aux:Lens=EF50mm f/1.8",
                        "exif:DateTimeOriginal=2021-07-04T13:45:10", "exif:FNumber=2.8",
                        "xmp:Rating=4", "xmp:Label=Red"}) {
    EXPECT_NE(std::find(records.begin(), records.end(), r), records.end()) << r;
  }

  // Decoding applies the orientation: the header's 640 x 480 turns upright.
  DecodedImage upright = MustDecode(path, {.maxSide = 100});
  EXPECT_EQ(Shape(upright), std::tuple(75u, 100u, 480u, 640u, kFormatJpeg));
  EXPECT_EQ(upright.info.orientation, 6);
  EXPECT_EQ(MustDecode(path, {.maxSide = 100, .autoRotate = false}).width, 100u);
}

TEST_F(HostFiles, MetadataFallbacksAndFailures) {
  std::string path = P("sparse.jpg");
  fs::copy_file(P("photo.jpg"), path, fs::copy_options::overwrite_existing);
  {
    auto image = Exiv2::ImageFactory::open(path);
    Exiv2::ExifData exif;
    exif["Exif.Photo.DateTimeOriginal"] = "0000:00:00 00:00:00";  // a clock never set
    exif["Exif.Image.DateTime"] = "2020:02:29 23:59:59";
    exif["Exif.Image.RatingPercent"] = uint16_t(75);
    exif["Exif.GPSInfo.GPSLatitude"] = "1/1 0/1 0/1";  // no longitude: no position
    image->setExifData(exif);
    image->writeMetadata();
  }
  ImageMetadata m;
  ASSERT_TRUE(MetadataReader::Read(path, &m).ok());
  EXPECT_EQ(std::tuple(m.dateTakenText, m.rating, m.hasGps, m.xmpPacket),
            std::tuple("2020-02-29T23:59:59", 4, false, ""));

  ASSERT_TRUE(MetadataReader::Read(P("photo.jpg"), &m).ok());
  EXPECT_FALSE(m.hasDateTaken);
  EXPECT_TRUE(m.FullTextRecords().empty());

  EXPECT_EQ(MetadataReader::Read(P("missing.jpg"), &m).code(), HostStatus::kIoError);
  EXPECT_EQ(MetadataReader::Read(P("text.jpg"), &m).code(), HostStatus::kUnsupported);
  EXPECT_FALSE(MetadataReader::Read(P("empty.jpg"), &m).ok());
  const uint8_t junk[] = {0xFF, 0xD8, 0xFF, 0xE1, 0xFF, 0xFF, 'E', 'x', 'i', 'f', 0, 0};
  EXPECT_FALSE(MetadataReader::ReadBuffer(junk, sizeof junk, &m).ok());
  MetadataReader::Read(P("corrupt.jpg"), &m);  // must merely survive
  MetadataReader::Read(P("huge.png"), &m);
}

TEST(HostMetadataText, ExposureAndPercentRating) {
  const std::pair<double, const char*> exposures[] = {
      {1.0 / 250, "1/250"}, {1.0 / 3, "1/3"}, {0.6, "0.6"}, {2, "2"}, {0, ""},
  };
  for (auto [seconds, text] : exposures) EXPECT_EQ(MetadataReader::ExposureText(seconds), text);
  const std::pair<int, int> stars[] = {{0, 0}, {1, 1}, {25, 2}, {50, 3}, {99, 5}};
  for (auto [percent, n] : stars) {
    EXPECT_EQ(MetadataReader::StarsFromPercent(percent), n) << percent;
  }
}

TEST(HostFileCrc, MatchesZlibAcrossBlocks) {
  vxtest::TempDir dir;
  std::string big(3 * 1024 * 1024 + 17, '\0');
  for (size_t i = 0; i < big.size(); ++i) big[i] = char(i * 7 + i / 1000);
  // "123456789" gives the CRC-32 check value, 0xCBF43926.
  for (const std::string& content : {std::string("123456789"), std::string(), big}) {
    uint32_t crc = 1;
    vxtest::WriteFile(dir / "f", content);
    ASSERT_TRUE(ComputeFileCrc(dir / "f", &crc).ok());
    EXPECT_EQ(crc, crc32(0, reinterpret_cast<const Bytef*>(content.data()), uInt(content.size())));
  }
  uint32_t crc;
  EXPECT_EQ(ComputeFileCrc(dir / "none", &crc).code(), HostStatus::kIoError);
  EXPECT_EQ(ComputeFileCrc(dir.path().string(), &crc).code(), HostStatus::kIoError);
}

TEST(HostVolumeTable, MountsLabelsAndSerial) {
  vxtest::TempDir dir;
  vxtest::WriteFile(dir / "sdb1", "");
  fs::create_directory(dir / "by-label");
  fs::create_symlink(dir / "sdb1", dir / "by-label/My\\x20Disk");
  std::string mounts = "/dev/vda / ext4 rw 0 0\n" + (dir / "sdb1") +
                       " /media/usb\\040stick vfat rw 0 0\n"
                       "tmpfs /media/usb2 tmpfs rw 0 0\n"
                       "other /media/usb2 tmpfs rw 0 0\n";
  VolumeTable table(mounts, dir / "by-label");
  ASSERT_EQ(table.mounts().size(), 4u);
  EXPECT_EQ(table.FindMount("/media/usb stick/a")->mountPoint, "/media/usb stick");
  EXPECT_EQ(table.FindMount("/media/usb sticky")->mountPoint, "/");
  EXPECT_EQ(table.FindMount("/media/usb2")->device, "other");  // the later mount hides
  EXPECT_EQ(table.Identify("/media/usb stick/pics").mediaId, "My Disk");
  EXPECT_EQ(table.Identify("/media/usb2/x").mediaId, "/media/usb2");

  VolumeIdentity here = VolumeTable().Identify(dir.path().string());
  ASSERT_EQ(here.mediaSerial.size(), 10u);
  EXPECT_EQ(here.mediaSerial.substr(0, 2), "0x");
  EXPECT_EQ(dir.path().string().rfind(here.mountPoint, 0), 0u);
  CVXFolder folder;
  folder.MediaSerial() = here.mediaSerial;  // a 32-bit value the library can show
  EXPECT_NE(folder.MediaSerialWindows(), "FFFF-FFFF");
}

TEST(HostFolderWalk, TreeOrderFilesLoopsAndProblems) {
  vxtest::TempDir tmp;
  fs::path root = fs::canonical(tmp.path());
  fs::create_directories(root / "b/c");
  fs::create_directories(root / "a");
  // Not candidates: a text file, and ".jpg", no name but only a dot.
  for (const char* file : {"a/x.JPG", "a/notes.txt", "a/.jpg", "b/c/y.png", "z.heic"}) {
    vxtest::WriteFile((root / file).string(), "12345");
  }
  fs::create_directory_symlink(root, root / "loop");
  fs::create_symlink(root / "gone.jpg", root / "dangling.jpg");
  struct timespec times[2] = {{1000000000, 0}, {1000000000, 0}};
  utimensat(AT_FDCWD, (root / "a/x.JPG").c_str(), times, 0);

  FolderWalk walk;
  std::vector<WalkDirectory> dirs;
  auto collect = [&](const WalkDirectory& d) { return dirs.push_back(d), true; };
  HostStatus st = walk.Walk({root.string(), (root / "a").string(), "/no/such/dir"}, collect);
  EXPECT_EQ(st.code(), HostStatus::kIoError);
  ASSERT_EQ(walk.problems().size(), 1u);
  EXPECT_EQ(walk.problems()[0].path, "/no/such/dir");
  std::vector<std::string> order;
  order.reserve(dirs.size());
  for (const auto& d : dirs) order.push_back(d.path);
  std::string r = root.string();
  EXPECT_EQ(order, (std::vector<std::string>{r, r + "/a", r + "/b", r + "/b/c"}));
  EXPECT_EQ(std::tuple(dirs[0].parentPath, dirs[1].parentPath), std::tuple("", r));
  ASSERT_EQ(std::tuple(dirs[0].files.size(), dirs[1].files.size()), std::tuple(1u, 1u));
  const WalkFile& x = dirs[1].files[0];
  EXPECT_EQ(std::tuple(dirs[0].files[0].name, x.name, x.size, x.mtime),
            std::tuple("z.heic", "x.JPG", 5u, 1000000000));
  EXPECT_FALSE(dirs[3].volume.mediaSerial.empty());

  int seen = 0;  // walking again starts afresh; the visitor may stop it
  EXPECT_TRUE(walk.Walk({r}, [&](const WalkDirectory&) { return ++seen < 2; }).ok());
  EXPECT_EQ(seen, 2);
  EXPECT_TRUE(walk.problems().empty());
}

// Root reads every directory, so the walk runs in a child that, as root, drops to nobody.
TEST(HostFolderWalk, UnreadableDirectoryIsSkipped) {
  vxtest::TempDir tmp;
  const fs::path locked = tmp.path() / "locked";
  fs::create_directories(locked / "inner");
  chmod(tmp.path().c_str(), 0755);
  chmod(locked.c_str(), 0);
  pid_t pid = fork();
  if (pid == 0) {
    if (geteuid() == 0 && (setgid(65534) != 0 || setuid(65534) != 0)) _exit(2);
    FolderWalk walk;
    int dirs = 0;
    bool ok = walk.Walk({tmp.path().string()}, [&](const WalkDirectory&) { return ++dirs; }).ok();
    _exit(ok && dirs == 1 && walk.problems().size() == 1 ? 0 : 1);
  }
  int status = 0;
  waitpid(pid, &status, 0);
  chmod(locked.c_str(), 0700);
  EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0) << status;
}

// Captures what a Progress writes, with a clock the test moves.
struct ProgressCapture {
  char* text = nullptr;
  size_t size = 0;
  std::FILE* file = open_memstream(&text, &size);
  double now = 0;
  ~ProgressCapture() {
    std::fclose(file);
    free(text);
  }
  std::string Output() {
    std::fflush(file);
    return std::string(text, size);
  }
  Progress::Options Options(Progress::Mode mode, double plainEverySeconds = 5) {
    Progress::Options o;
    o.mode = mode;
    o.plainEverySeconds = plainEverySeconds;
    o.barWidth = 10;
    o.clock = [this] { return now; };
    return o;
  }
};

TEST(HostProgress, PlainLinesByCountAndTimeThenSummary) {
  ProgressCapture cap;
  {
    Progress p(cap.file, "import", 4000, cap.Options(Progress::Mode::kPlain, 10));
    EXPECT_FALSE(p.terminal());
    for (int i = 1; i <= 2500; ++i) {
      cap.now = i * 0.01;
      p.Add();
    }
    cap.now = 31;  // quiet for a while, then one more file: a line by time
    p.Add();
  }
  EXPECT_EQ(cap.Output(),
            "import: 1000/4000 files (25%), 100.0 files/s, 0:30 left\n"
            "import: 2000/4000 files (50%), 100.0 files/s, 0:20 left\n"
            "import: 2501/4000 files (62%), 80.7 files/s, 0:19 left\n"
            "import: 2501 files in 0:31, 80.7 files/s\n");
}

TEST(HostProgress, TerminalRedrawsOneLine) {
  ProgressCapture cap;
  Progress p(cap.file, "scan", 0, cap.Options(Progress::Mode::kTerminal));
  p.SetTotal(10);
  cap.now = 1;
  p.Add(4);
  p.Add();  // within the redraw interval: not drawn
  p.Finish();
  p.Finish();
  EXPECT_EQ(cap.Output(),
            "\rscan [####------] 4/10  4.0 files/s  0:02 left\x1b[K"
            "\rscan [#####-----] 5/10  5.0 files/s  0:01 left\x1b[K\n"
            "scan: 5 files in 0:01, 5.0 files/s\n");
  EXPECT_EQ(Progress::FormatDuration(3723.4), "1:02:03");
  EXPECT_EQ(Progress::FormatDuration(-1), "0:00");
}

TEST(HostProgress, CountsFromManyThreads) {
  ProgressCapture cap;
  Progress p(cap.file, "t", 40000, cap.Options(Progress::Mode::kTerminal));
  std::vector<std::thread> threads(4);
  for (auto& t : threads) {
    t = std::thread([&] {
      for (int i = 0; i < 10000; ++i) p.Add();
    });
  }
  for (auto& t : threads) t.join();
  EXPECT_EQ(p.done(), 40000u);
}

TEST(HostJsonWriter, NestingEscapingAndNumbers) {
  std::ostringstream out;
  JsonWriter json(out);
  json.BeginObject().Key("name").String("a\"b\\c\n\x01\x7F").Key("list").BeginArray();
  json.Int(-3).UInt(18446744073709551615u).Double(0.1).Double(NAN).Bool(true).Null();
  json.BeginObject().EndObject().EndArray().Key("bad").String("\xC3\xA9|\xFF|\xC3|\xED\xA0\x80");
  json.EndObject();
  EXPECT_EQ(out.str(),
            "{\"name\":\"a\\\"b\\\\c\\n\\u0001\\u007f\",\"list\":[-3,18446744073709551615,0.1,"
            "null,true,null,{}],\"bad\":\"\xC3\xA9|\xEF\xBF\xBD|\xEF\xBF\xBD|\xEF\xBF\xBD\xEF\xBF"
            "\xBD\xEF\xBF\xBD\"}");

  std::ostringstream pretty;
  JsonWriter(pretty, true).BeginObject().Key("a").BeginArray().Int(1).Int(2).EndArray().EndObject();
  EXPECT_EQ(pretty.str(), "{\n  \"a\": [\n    1,\n    2\n  ]\n}\n");
}

TEST(HostHtmlReport, SelfContainedEscapedPage) {
  const auto* foobar = reinterpret_cast<const uint8_t*>("foobar");
  EXPECT_EQ(std::vector({HtmlReport::Base64(foobar, 6), HtmlReport::Base64(foobar, 4),
                         HtmlReport::Base64(foobar, 2)}),
            std::vector<std::string>({"Zm9vYmFy", "Zm9vYg==", "Zm8="}));
  EXPECT_EQ(HtmlReport::Escape("<a href='x'>&\"</a>"),
            "&lt;a href=&#39;x&#39;&gt;&amp;&quot;&lt;/a&gt;");

  std::ostringstream out;  // the report finishes the page when it goes
  HtmlReport(out, "Dupes <1>")
      .AddGroup(
          {"Group & co", {{"/p/a<b>.jpg", {0xFF, 0xD8, 0xFF}, "99.5"}, {"/p/none.jpg", {}, ""}}});
  std::string html = out.str();
  for (const char* part :
       {"<title>Dupes &lt;1&gt;</title>", "<h2>Group &amp; co</h2>",
        "src=\"data:image/jpeg;base64,/9j/\"", "/p/a&lt;b&gt;.jpg", "no preview", "99.5"}) {
    EXPECT_TRUE(Has(html, part));
  }
  EXPECT_EQ(html.find("<script"), std::string::npos);
  EXPECT_EQ(html.find("http"), std::string::npos);
  EXPECT_EQ(html.substr(html.size() - 15), "</body></html>\n");

  std::ostringstream none;
  HtmlReport(none, "x").Finish();
  EXPECT_TRUE(Has(none.str(), "Nothing to show"));
}

}  // namespace
