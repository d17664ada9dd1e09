#include "Importer.h"

#include <algorithm>
#include <chrono>
#include <filesystem>
#include <optional>
#include <thread>

#include "FileCrc.h"

namespace vx {

namespace {

// A folder's path as the walk reports it: no trailing separator except for the root.
std::string FolderKey(const CVXURI& uri) {
  std::string path = uri.NoProtocol();
  if (path.size() > 1 && path.back() == '/') path.pop_back();
  return path;
}

CVXProperty Text(const std::string& text) { return text.empty() ? CVXProperty() : text; }

CVXProperty Positive(double value) { return value > 0 ? CVXProperty(value) : CVXProperty(); }

using Clock = std::chrono::steady_clock;

double Seconds(Clock::duration d) { return std::chrono::duration<double>(d).count(); }

}  // namespace

template <typename Step>
auto Importer::Timed_(Stage stage, Step step) {
  const Clock::time_point start = Clock::now();
  auto result = step();
  nanos_[stage] +=
      std::chrono::duration_cast<std::chrono::nanoseconds>(Clock::now() - start).count();
  return result;
}

Importer::Importer(Database* db, const CVXTable& table, const ImportOptions& options)
    : db_(db), table_(table), options_(options) {}

ImportCounts Importer::Run(const std::vector<std::string>& roots) {
  const Clock::time_point start = Clock::now();
  thumbInfo_ = db_->engine().GetThumbInfo();
  vxhost::DecodeOptions decodeOptions;
  decodeOptions.maxSide = db_->DecodeSide();
  decoder_ = vxhost::ImageDecoder(decodeOptions);
  std::vector<uint32_t> known;
  db_->engine().GetFolders(known);
  CVXFolder folder;
  for (uint32_t oid : known) {
    if (db_->engine().GetFolder(oid, folder) == VX_OK) folders_[FolderKey(folder.URI())] = oid;
  }
  vxhost::FolderWalk walk;
  walk.Walk(roots, [this](const vxhost::WalkDirectory& dir) {
    Collect_(dir);
    return true;
  });
  for (const vxhost::WalkProblem& p : walk.problems()) {
    problems_.push_back(p.path + ": " + p.message);
  }

  vxhost::Progress::Options progressOptions;
  progressOptions.mode = options_.progress;
  std::optional<vxhost::Progress> progress;
  if (options_.showProgress) progress.emplace(stderr, "import", tasks_.size(), progressOptions);
  vxhost::Progress* shown = progress ? &*progress : nullptr;
  unsigned threads = options_.threads ? options_.threads : std::thread::hardware_concurrency();
  threads = std::clamp<unsigned>(threads, 1, std::max<size_t>(tasks_.size(), 1));
  std::vector<std::thread> pool;
  for (unsigned i = 0; i < threads; ++i) pool.emplace_back([&] { Work_(shown); });
  for (std::thread& t : pool) t.join();
  if (shown) shown->Finish();
  db_->engine().Flush();

  ImportCounts counts;
  counts.imported = counts_[static_cast<int>(Outcome::kImported)];
  counts.updated = counts_[static_cast<int>(Outcome::kUpdated)];
  counts.unchanged = counts_[static_cast<int>(Outcome::kUnchanged)];
  counts.skipped = counts_[static_cast<int>(Outcome::kSkipped)];
  counts.times.wall = Seconds(Clock::now() - start);
  double* stages[kStages] = {&counts.times.crc, &counts.times.decode, &counts.times.metadata,
                             &counts.times.thumbnail, &counts.times.library};
  for (int i = 0; i < kStages; ++i) *stages[i] = static_cast<double>(nanos_[i]) * 1e-9;
  return counts;
}

std::vector<std::string> Importer::Problems() const {
  std::lock_guard<std::mutex> lock(problemsMutex_);
  std::vector<std::string> sorted = problems_;
  std::sort(sorted.begin(), sorted.end());
  return sorted;
}

// Runs on the walking thread: folders and the catalog's records are read before any worker
// starts, so workers never look anything up.
void Importer::Collect_(const vxhost::WalkDirectory& dir) {
  const uint32_t folder = AddFolder_(dir);
  if (folder == 0) return;
  std::map<std::string, CVXCatFile> existing;
  std::vector<uint32_t> files;
  db_->engine().GetFolderFiles(folder, files, false);
  CVXCatFile record;
  for (uint32_t oid : files) {
    if (db_->engine().GetFile(oid, record) == VX_OK) existing[record.Name()] = record;
  }
  for (const vxhost::WalkFile& f : dir.files) {
    Task task;
    task.path = dir.path == "/" ? "/" + f.name : dir.path + "/" + f.name;
    task.name = f.name;
    task.folder = folder;
    task.size = f.size;
    task.mtime = f.mtime;
    if (auto it = existing.find(f.name); it != existing.end()) {
      task.exists = true;
      task.record = it->second;
    }
    tasks_.push_back(std::move(task));
  }
}

// A folder already in the catalog keeps its record: handing it to AddFolder again would
// replace its lists of files and children.
uint32_t Importer::AddFolder_(const vxhost::WalkDirectory& dir) {
  if (auto it = folders_.find(dir.path); it != folders_.end()) return it->second;
  uint32_t parent = 0;
  if (auto it = folders_.find(dir.parentPath); it != folders_.end()) parent = it->second;
  if (parent == 0) {
    // A root below a folder of an earlier import hangs under it.
    const std::string above = std::filesystem::path(dir.path).parent_path().string();
    if (auto it = folders_.find(above); it != folders_.end() && above != dir.path) {
      parent = it->second;
    }
  }
  CVXFolder folder(CVXURI(dir.path, true), 0, parent);
  folder.MediaID() = dir.volume.mediaId;
  folder.MediaSerial() = dir.volume.mediaSerial;
  if (unsigned rc = db_->engine().AddFolder(folder); rc != VX_OK) {
    std::lock_guard<std::mutex> lock(problemsMutex_);
    problems_.push_back(dir.path + ": cannot add the folder (error " + std::to_string(rc) + ")");
    counts_[static_cast<int>(Outcome::kSkipped)] += dir.files.size();
    return 0;
  }
  folders_[dir.path] = folder.Oid();
  return folder.Oid();
}

void Importer::Work_(vxhost::Progress* progress) {
  for (size_t i = next_++; i < tasks_.size(); i = next_++) {
    Outcome outcome = Import_(tasks_[i]);
    ++counts_[static_cast<int>(outcome)];
    if (progress) progress->Add();
  }
}

Importer::Outcome Importer::Import_(Task& task) {
  uint32_t crc = 0;
  if (auto s = Timed_(kCrc, [&] { return vxhost::ComputeFileCrc(task.path, &crc); }); !s.ok()) {
    Fail_(task, s.ToString());
    return Outcome::kSkipped;
  }
  CVXCatFile::SData& data = task.record.Properties();
  if (task.exists && data.Size == task.size && data.FileTime == task.mtime && data.CRC == crc) {
    return Outcome::kUnchanged;
  }
  vxhost::DecodedImage image;
  if (auto s = Timed_(kDecode, [&] { return decoder_.Decode(task.path, &image); }); !s.ok()) {
    Fail_(task, s.ToString());
    return Outcome::kSkipped;
  }
  // Metadata are a bonus: an image whose metadata do not read is imported without them.
  vxhost::ImageMetadata meta;
  if (!Timed_(kMetadata, [&] { return vxhost::MetadataReader::Read(task.path, &meta); }).ok()) {
    meta = vxhost::ImageMetadata();
  }
  vxhost::EncodedJpeg thumbnail;
  const vxhost::HostStatus encoded =
      Timed_(kThumbnail, [&] { return Thumbnail_(image, &thumbnail); });
  if (!encoded.ok()) {
    Fail_(task, "thumbnail: " + encoded.ToString());
    return Outcome::kSkipped;
  }

  if (!task.exists) task.record = CVXCatFile(0, task.name, task.folder);
  data.Width = image.info.width;
  data.Height = image.info.height;
  data.Size = static_cast<uint32_t>(std::min<uint64_t>(task.size, UINT32_MAX));
  data.Format = image.info.format;
  data.FileTime = static_cast<int32_t>(task.mtime);
  data.EmbeddedTime = meta.hasDateTaken ? static_cast<int32_t>(meta.dateTaken) : 0;
  data.Flags = static_cast<uint16_t>(data.Flags & ~cfEmbeddedTimeValid);
  if (meta.hasDateTaken) data.Flags |= cfEmbeddedTimeValid;

  CVXBitmap bitmap;
  if (vxhost::FillBitmap(image, &bitmap) != VX_OK) {
    Fail_(task, "no pixels");
    return Outcome::kSkipped;
  }
  const unsigned rc =
      Timed_(kLibrary, [&] { return db_->engine().AddFile(task.record, bitmap, crc); });
  if (rc != VX_OK) {
    Fail_(task, "cannot add the file (error " + std::to_string(rc) + ")");
    return Outcome::kSkipped;
  }
  std::string error;
  if (!Timed_(kLibrary,
              [&] { return StoreDependents_(task.record.Oid(), thumbnail, meta, &error); })) {
    Fail_(task, error);
  }
  return task.exists ? Outcome::kUpdated : Outcome::kImported;
}

vxhost::HostStatus Importer::Thumbnail_(const vxhost::DecodedImage& image,
                                        vxhost::EncodedJpeg* jpeg) const {
  const SVXThumbInfoNew& info = thumbInfo_;
  return vxhost::EncodeJpegThumbnail(image.pixels.data(), image.width, image.height,
                                     std::max(info.Width, 16u), std::max(info.Height, 16u),
                                     info.Quality ? static_cast<int>(info.Quality) : 85, jpeg);
}

bool Importer::StoreDependents_(uint32_t oid, const vxhost::EncodedJpeg& jpeg,
                                const vxhost::ImageMetadata& meta, std::string* error) {
  CVXEngine& engine = db_->engine();
  CVXThumb thumb;
  thumb.Create(jpeg.width, jpeg.height, vxhost::kFormatJpeg,
               static_cast<uint32_t>(jpeg.bytes.size()), jpeg.bytes.data());
  unsigned rc = engine.AddThumb(oid, thumb);
  if (rc == VX_OK) rc = engine.SetImageProperties(oid, PropertyRow_(meta));
  SXMPRecord xmp;
  xmp.Oid = oid;
  xmp.Packet = meta.xmpPacket;
  xmp.Rating = meta.rating;
  xmp.Label = meta.label;
  if (rc == VX_OK) rc = engine.SetXMP(&xmp, false);
  if (rc == VX_OK) rc = engine.SetXMPFTI(oid, meta.FullTextRecords());
  if (rc != VX_OK) *error = "cannot store thumbnail or metadata (error " + std::to_string(rc) + ")";
  return rc == VX_OK;
}

// One value per column of the table, in its order; columns the importer does not know (a
// host may have added some) stay empty.
std::vector<CVXProperty> Importer::PropertyRow_(const vxhost::ImageMetadata& meta) const {
  std::map<std::string, CVXProperty> values = {
      {"Make", Text(meta.make)},
      {"Model", Text(meta.model)},
      {"Lens", Text(meta.lens)},
      {"Software", Text(meta.software)},
      {"Artist", Text(meta.artist)},
      {"Copyright", Text(meta.copyright)},
      {"Title", Text(meta.title)},
      {"Description",
       meta.description.empty() ? CVXProperty() : CVXProperty::MakeLongText(meta.description)},
      {"ExposureTime", Positive(meta.exposureTime)},
      {"Exposure", Text(meta.exposureText)},
      {"Aperture", Positive(meta.fNumber)},
      {"ISO", meta.iso ? CVXProperty(meta.iso) : CVXProperty()},
      {"FocalLength", Positive(meta.focalLength)},
      {"Orientation", meta.orientation ? CVXProperty(int32_t{meta.orientation}) : CVXProperty()},
      {"Rating", meta.rating ? CVXProperty(int32_t{meta.rating}) : CVXProperty()},
      {"Label", Text(meta.label)},
      {"City", Text(meta.city)},
      {"State", Text(meta.state)},
      {"Country", Text(meta.country)},
  };
  if (meta.hasDateTaken) {
    std::string text = meta.dateTakenText;
    std::replace(text.begin(), text.end(), 'T', ' ');
    values["DateTaken"].SetString(text, vptDate);
  }
  if (meta.hasGps) {
    values["Latitude"] = CVXProperty(meta.latitude);
    values["Longitude"] = CVXProperty(meta.longitude);
  }
  std::string keywords;
  for (const std::string& k : meta.keywords) keywords += (keywords.empty() ? "" : "; ") + k;
  if (!keywords.empty()) values["Keywords"] = CVXProperty::MakeLongText(keywords);

  std::vector<CVXProperty> row;
  for (const SVXColumn& column : table_.Columns()) {
    auto it = values.find(column.Name);
    row.push_back(it == values.end() ? CVXProperty() : it->second);
  }
  return row;
}

void Importer::Fail_(const Task& task, const std::string& reason) {
  std::lock_guard<std::mutex> lock(problemsMutex_);
  problems_.push_back(task.path + ": " + reason);
}

}  // namespace vx
