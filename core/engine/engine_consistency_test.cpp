// A fixed-seed random sequence of file and folder operations through the engine, after which the
// catalog and the other stores must agree: every listed file has its shape data and thumbnail,
// no store holds data of a file the catalog lacks, and no folder lists a file that is not its
// own. The same sequence is also killed at a step, or in the middle of one, and the database
// reopened.
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/mman.h>
#include <sys/wait.h>
#include <unistd.h>

#include <iterator>
#include <random>
#include <set>
#include <string>
#include <vector>

#include "vxengine_fixture.h"

namespace {

using vxtest::ProbeEngine;

constexpr size_t kColumns = 4;

// Up to N non-zero OIDs, in a plain array so that they lie wholly in the shared mapping.
template <uint32_t N>
struct SOids {
  uint32_t Count = 0;
  uint32_t Oids[N];
  void Add(uint32_t oid) {
    if (oid != 0 && Count < N) Oids[Count++] = oid;
  }
  std::set<uint32_t> Set() const { return {Oids, Oids + Count}; }
};

// What a step is doing, where a parent process can read it after the child was killed. The
// step fills it in before it calls the engine, in one shared mapping with room for every file
// the sequences make.
struct SProgress {
  int Step = -1;
  uint32_t LastFileOid = 0;  // the catalog's counter before the step
  bool Adds = false;         // adds a file from a bitmap, its thumbnail to follow
  bool DataFirst = false;    // removes files, their data before their catalog records
  // Files the step removes: the file or the folder's files it removes, or the file that a move
  // or copy replaces.
  SOids<8192> Removed;
  // Folders that the step may leave listing a file that is no longer theirs. Moving a file, the
  // catalog stores the target's list, then the file's record, then the source's list; merging
  // folders, it stores the records of the source's files before the lists. Cut short, a moved
  // file can be in both lists, merged files in the source's list alone.
  SOids<4> Lists;

  void Begin(uint32_t lastFileOid) {
    Removed.Count = Lists.Count = 0;
    Adds = DataFirst = false;
    LastFileOid = lastFileOid;
  }
};

// Draws operations on what the catalog holds now. Each step is one host action: a file added
// from a bitmap comes with its thumbnail. Results that must be 10001 are counted when not.
class Sequence {
 public:
  Sequence(CVXEngine& engine, uint32_t seed) : engine_(engine), rng_(seed) {}

  void Start() {
    for (int i = 0; i < 3; ++i) AddFolder("c:/root" + std::to_string(i) + "/");
  }

  void Step(SProgress& progress) {
    struct SOp {
      int weight;
      void (Sequence::*run)(SProgress&);
      bool needsFile;
    };
    static const SOp kOps[] = {
        {25, &Sequence::Add, false},         {10, &Sequence::AddReady, false},
        {8, &Sequence::Properties, true},    {10, &Sequence::Move, true},
        {10, &Sequence::Copy, true},         {5, &Sequence::Rename, true},
        {5, &Sequence::Reprocess, true},     {12, &Sequence::Remove, true},
        {7, &Sequence::NewFolder, false},    {3, &Sequence::RenameFolder, false},
        {3, &Sequence::RemoveFolder, false}, {2, &Sequence::BadTarget, false}};
    std::vector<int> weights;
    for (const SOp& op : kOps) weights.push_back(op.weight);
    int op = std::discrete_distribution<int>(weights.begin(), weights.end())(rng_);
    if (engine_.Catalog().NumberOfFiles() == 0 && kOps[op].needsFile) op = 0;
    progress.Begin(engine_.Catalog().Header().LastFileOid);
    if (engine_.Catalog().NumberOfFolders() == 0) return AddFolder("c:/root" + Number() + "/");
    (this->*kOps[op].run)(progress);
  }

  int unexpected = 0;

 private:
  uint32_t Draw(uint32_t n) { return std::uniform_int_distribution<uint32_t>(0, n - 1)(rng_); }
  bool Coin() { return Draw(2) == 0; }
  std::string Number() { return std::to_string(counter_++); }
  void Expect(unsigned rc) { unexpected += rc != VX_OK; }

  template <typename Map>
  uint32_t Any(const Map& map) {
    if (map.empty()) return 0;
    return std::next(map.begin(), Draw(static_cast<uint32_t>(map.size())))->first;
  }
  uint32_t AnyFile() { return Any(engine_.Catalog().Files()); }
  uint32_t AnyFolder() { return Any(engine_.Catalog().Folders()); }
  // Few names in mixed case, so that adds update, and moves and copies meet targets.
  std::string AnyName() {
    std::string name = "img" + std::to_string(Draw(12)) + ".jpg";
    if (Coin()) name[0] = 'I';
    return name;
  }
  std::string FolderURI(uint32_t oid) {
    return engine_.Catalog().Folders().at(oid).URI().NoProtocol();
  }
  // The file of that name in the folder's list, which a move or copy there replaces.
  uint32_t InTheWay(uint32_t folder, const std::string& name, uint32_t skip) {
    const auto& files = engine_.Catalog().Files();
    for (uint32_t oid : engine_.Catalog().Folders().at(folder).Files()) {
      auto file = files.find(oid);
      bool named = file != files.end() && CVXCatFile::CompareNames(file->second.Name(), name) == 0;
      if (oid != skip && named) return oid;
    }
    return 0;
  }

  void AddFolder(const std::string& uri) {
    CVXFolder folder(CVXURI(uri, true), 0, 0);
    folder.MediaID() = "VOL";
    folder.MediaSerial() = "1";
    Expect(engine_.AddFolder(folder));
  }
  void NewFolder(SProgress&) { AddFolder(FolderURI(AnyFolder()) + "d" + Number() + "/"); }

  void Add(SProgress& progress) {
    progress.Adds = true;
    uint32_t seed = Draw(1000);
    CVXCatFile file(0, AnyName(), AnyFolder());
    Expect(engine_.AddFile(file, vxtest::MakeBitmap(16, 12, seed), seed));
    CVXThumb thumb = vxtest::MakeThumb(40, 30, 200 + seed, static_cast<uint8_t>(seed));
    Expect(engine_.AddThumb(file.Oid(), thumb));
    if (Coin()) SetProperties(file.Oid());
  }

  void AddReady(SProgress&) {
    uint32_t seed = Draw(1000);
    CVXCatFile file(0, AnyName(), AnyFolder());
    CVXThumb thumb = vxtest::MakeThumb(30, 40, 100 + seed, static_cast<uint8_t>(seed));
    Expect(engine_.AddFile(file, thumb, vxtest::MakeShape(static_cast<uint8_t>(seed))));
  }

  void Properties(SProgress&) { SetProperties(AnyFile()); }
  void SetProperties(uint32_t oid) {
    uint32_t what = Draw(4);
    if (what == 0) return Expect(engine_.SetImageProperties(oid, vxtest::MakeRow(oid, kColumns)));
    if (what == 1) return Expect(engine_.RemoveImageProperties(oid));
    if (what == 3) return Expect(engine_.DeleteXMP(oid));
    SXMPRecord rec;
    rec.Oid = oid;
    rec.Packet = "<xmp " + Number() + "/>";
    rec.Rating = 1 + static_cast<int32_t>(Draw(5));
    Expect(engine_.SetXMP(&rec, false));
    Expect(engine_.SetXMPFTI(oid, {{"dc:subject", rec.Packet}}));
  }

  void Move(SProgress& progress) {
    uint32_t oid = AnyFile();
    uint32_t folder = AnyFolder();
    std::string name = AnyName();
    progress.Lists.Add(engine_.Catalog().Files().at(oid).Properties().Folder);
    progress.Lists.Add(folder);
    progress.Removed.Add(InTheWay(folder, name, oid));
    Expect(engine_.MoveFile(oid, folder, name, Coin()));
  }

  void Copy(SProgress& progress) {
    uint32_t oid = AnyFile();
    uint32_t folder = AnyFolder();
    std::string name = AnyName();
    progress.Removed.Add(InTheWay(folder, name, 0));
    unsigned long newOid = 0;
    Expect(engine_.CopyFile(oid, folder, newOid, name, Coin()));
  }

  void Rename(SProgress&) { Expect(engine_.RenameFile(AnyFile(), AnyName())); }

  void Remove(SProgress& progress) {
    uint32_t oid = AnyFile();
    progress.DataFirst = true;
    progress.Removed.Add(oid);
    Expect(engine_.RemoveFile(oid));
  }

  void Reprocess(SProgress&) {
    CVXCatFile file;
    Expect(engine_.GetFile(AnyFile(), file));
    CVXBitmap bitmap = vxtest::MakeBitmap(12, 12, Draw(1000));
    Expect(engine_.SetFile(file, &bitmap, Draw(1000)));
  }

  // To a free root, or merged into another folder when neither has sub-folders.
  void RenameFolder(SProgress& progress) {
    uint32_t from = AnyFolder();
    uint32_t into = AnyFolder();
    const auto& folders = engine_.Catalog().Folders();
    bool merge = Coin() && from != into && folders.at(from).Children().empty() &&
                 folders.at(into).Children().empty();
    if (merge) progress.Lists.Add(from);
    CVXURI uri(merge ? FolderURI(into) : "c:/moved" + Number() + "/", true);
    Expect(engine_.RenameFolder(from, uri, "VOL", "1"));
  }

  // The files are those of the folders' lists, which the engine and the catalog walk.
  void RemoveFolder(SProgress& progress) {
    progress.DataFirst = true;
    if (engine_.Catalog().NumberOfFolders() <= 2) return;
    uint32_t oid = AnyFolder();
    const auto& folders = engine_.Catalog().Folders();
    std::vector<uint32_t> tree{oid};
    for (size_t i = 0; i < tree.size(); ++i) {
      auto folder = folders.find(tree[i]);
      if (folder == folders.end()) continue;
      for (uint32_t file : folder->second.Files()) progress.Removed.Add(file);
      tree.insert(tree.end(), folder->second.Children().begin(), folder->second.Children().end());
    }
    Expect(engine_.RemoveFolder(oid));
  }

  // Operations aimed at what is not there fail and must leave nothing behind.
  void BadTarget(SProgress&) {
    CVXCatFile file(0, AnyName(), 0xFFFF0000u);
    unexpected += engine_.AddFile(file, vxtest::MakeBitmap(4, 4, 1), 0) != VX_NOT_FOUND;
    unsigned long newOid = 0;
    unexpected += engine_.CopyFile(0xFFFF0001u, AnyFolder(), newOid, "", false) != VX_NOT_FOUND;
    if (uint32_t oid = AnyFile()) {
      unexpected += engine_.CopyFile(oid, 0xFFFF0000u, newOid, "", false) != VX_NOT_FOUND;
    }
  }

  CVXEngine& engine_;
  std::mt19937 rng_;
  int counter_ = 0;
};

// What the step in flight may have left half done because it was cut short.
struct SExcuses {
  std::set<uint32_t> noData;   // listed, but their removal had begun
  std::set<uint32_t> noThumb;  // added from a bitmap, killed before the thumbnail came
  std::set<uint32_t> lists;    // folders that may list a file that is no longer theirs
};

// Whether a folder may list the file: it has a record, and the record names the folder.
bool Owns(const CVXCatalog& catalog, uint32_t folder, uint32_t file) {
  auto it = catalog.Files().find(file);
  return it != catalog.Files().end() && it->second.Properties().Folder == folder;
}

// Folders that list a file that is not their own. Removing such a folder strips the data of
// that file too, and the catalog then fails on it with the folder's other files still listed.
// (The other way round is no fault: a folder added again with an empty list keeps none of its
// files, which stay in the catalog and name it.)
std::set<uint32_t> FoldersListingOthers(const CVXCatalog& catalog) {
  std::set<uint32_t> out;
  for (const auto& [oid, folder] : catalog.Folders()) {
    for (uint32_t file : folder.Files()) {
      if (!Owns(catalog, oid, file)) out.insert(oid);
    }
  }
  return out;
}

// Checks both directions and the folders' lists. Records in the stores without a catalog
// record fail the test only when `orphansAllowed` is false.
void ExpectAgreement(ProbeEngine& engine, const SExcuses& excuses, bool orphansAllowed) {
  for (uint32_t folder : FoldersListingOthers(engine.Catalog())) {
    EXPECT_TRUE(excuses.lists.count(folder)) << "folder " << folder << " lists another's file";
  }
  vxtest::StoreContents c = vxtest::ReadStores(engine);
  const auto& files = engine.Catalog().Files();
  for (const auto& [oid, file] : files) {
    if (excuses.noData.count(oid)) continue;
    EXPECT_TRUE(c.shapes.count(oid)) << "listed file " << oid << " has no shape data";
    EXPECT_TRUE(c.thumbs.count(oid) || excuses.noThumb.count(oid))
        << "listed file " << oid << " has no thumbnail";
  }
  for (const auto* store : {&c.shapes, &c.thumbs, &c.properties, &c.xmp}) {
    for (uint32_t oid : *store) {
      EXPECT_TRUE(orphansAllowed || files.count(oid))
          << "data of file " << oid << " without a catalog record";
    }
  }
}

class EngineConsistencyTest : public vxtest::EngineFixture {
 protected:
  void SetUp() override {
    EngineFixture::SetUp();
    engine_.SetLogFile(nullptr);  // thousands of operations: the log would dominate the time
    vxtest::DefineColumns(engine_, kColumns);
  }

  // Runs `steps` steps of a sequence on the fixture's engine; none may fail.
  void RunSteps(uint32_t seed, int steps, bool start = false) {
    Sequence sequence(engine_, seed);
    if (start) sequence.Start();
    SProgress progress;
    for (int i = 0; i < steps; ++i) sequence.Step(progress);
    EXPECT_EQ(sequence.unexpected, 0);
  }

  // Runs `steps` steps of the sequence in a child process on its own engine and kills it with
  // SIGKILL: after the last step, or with `killAfterMicros` set, from here once that time has
  // passed, wherever the child stands. Returns the child's last progress.
  SProgress RunInChild(uint32_t seed, int steps, long killAfterMicros) {
    EXPECT_EQ(engine_.Close(), VX_OK);
    void* shared =
        mmap(nullptr, sizeof(SProgress), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0);
    EXPECT_NE(shared, MAP_FAILED);
    auto* progress = new (shared) SProgress;
    pid_t pid = fork();
    if (pid == 0) {
      CVXEngine engine;
      if (engine.Open(info_) != VX_OK) _exit(2);
      Sequence sequence(engine, seed);
      sequence.Start();
      for (int i = 0; i < steps; ++i) {
        progress->Step = i;
        sequence.Step(*progress);
      }
      if (killAfterMicros == 0) raise(SIGKILL);
      _exit(0);  // not reached: the parent kills first
    }
    if (killAfterMicros > 0) {
      // The clock starts with the first step; a child that ended early is left to waitpid.
      siginfo_t ended{};
      while (__atomic_load_n(&progress->Step, __ATOMIC_ACQUIRE) < 0 &&
             waitid(P_PID, static_cast<id_t>(pid), &ended, WEXITED | WNOHANG | WNOWAIT) == 0 &&
             ended.si_pid == 0) {
        usleep(200);
      }
      usleep(static_cast<useconds_t>(killAfterMicros));
      kill(pid, SIGKILL);
    }
    int status = 0;
    waitpid(pid, &status, 0);
    SProgress last = *progress;
    munmap(shared, sizeof(SProgress));
    EXPECT_TRUE(WIFSIGNALED(status) && WTERMSIG(status) == SIGKILL) << "status " << status;
    EXPECT_EQ(engine_.Open(info_), VX_OK) << "the database did not reopen after the crash";
    return last;
  }

  // What the step in flight may have left half done, per the order of its store writes.
  // Removals take the data before the catalog record; a move or copy lets the catalog drop the
  // file it replaces first, and its data follows.
  SExcuses ExcusesFor(const SProgress& p) {
    SExcuses excuses;
    excuses.lists = p.Lists.Set();
    if (p.DataFirst) excuses.noData = p.Removed.Set();
    for (const auto& [oid, file] : engine_.Catalog().Files()) {
      if (p.Adds && oid > p.LastFileOid) excuses.noThumb.insert(oid);
    }
    return excuses;
  }

  // Finishes what the step in flight left half done, as later steps would otherwise work on a
  // half-written catalog. A removal is done again, the stores' misses do not stop it: always
  // for a removal, which may have taken the data already; for the file a move or copy
  // replaces, once its folder has let it go. A folder that the step may have left listing
  // another's file keeps only its own.
  void FinishStep(const SProgress& p) {
    const CVXCatalog& catalog = engine_.Catalog();
    std::set<uint32_t> listed;
    for (const auto& [oid, folder] : catalog.Folders()) {
      listed.insert(folder.Files().begin(), folder.Files().end());
    }
    for (uint32_t oid : p.Removed.Set()) {
      if (!catalog.IsUniqueFileOID(oid) && (p.DataFirst || !listed.count(oid))) {
        EXPECT_EQ(engine_.RemoveFile(oid), VX_OK) << oid;
      }
    }
    std::set<uint32_t> listingOthers = FoldersListingOthers(catalog);
    for (uint32_t oid : p.Lists.Set()) {
      if (!listingOthers.count(oid)) continue;
      CVXFolder folder = catalog.Folders().at(oid);
      std::erase_if(folder.Files(), [&](uint32_t file) { return !Owns(catalog, oid, file); });
      EXPECT_EQ(engine_.SetFolder(folder), VX_OK) << oid;
    }
  }
};

TEST_F(EngineConsistencyTest, RandomSequenceKeepsTheStoresInAgreement) {
  RunSteps(2024, 2000, true);
  EXPECT_GT(engine_.Catalog().NumberOfFiles(), 50u);
  ExpectAgreement(engine_, {}, false);
  Reopen();
  ExpectAgreement(engine_, {}, false);
}

// Killed between steps, after `steps`, every write had returned and survives the crash of the
// process: the reopened stores agree. Killed after `micros` inside whatever step runs then (the
// child has more steps than it can take before), only that step may be half done, and once it is
// finished work goes on. The kill steps were drawn once at random and fixed.
TEST_F(EngineConsistencyTest, KilledTheReopenedStoresAgreeButForTheStepCut) {
  const struct {
    uint32_t seed;
    int steps;
    long micros;
  } runs[] = {{7, 535, 0},          {8, 1838, 0},         {9, 63, 0},
              {21, 1 << 30, 30000}, {22, 1 << 30, 90000}, {23, 1 << 30, 170000}};
  for (const auto& run : runs) {
    SCOPED_TRACE(
        "seed " + std::to_string(run.seed) + " killed after " +
        (run.micros ? std::to_string(run.micros) + " us" : "step " + std::to_string(run.steps)));
    bool cut = run.micros != 0;
    SProgress p = RunInChild(run.seed, run.steps, run.micros);
    EXPECT_GE(p.Step, 0);
    SExcuses excuses = cut ? ExcusesFor(p) : SExcuses{};
    ExpectAgreement(engine_, excuses, cut);
    if (cut) {
      FinishStep(p);
      ExpectAgreement(engine_, {{}, excuses.noThumb, {}}, true);
    }
    // The host gives the new file its thumbnail, as it would have; what the cut step left
    // behind takes nothing from new files.
    for (uint32_t oid : excuses.noThumb) {
      CVXThumb thumb = vxtest::MakeThumb(40, 30, 64, 1);
      EXPECT_EQ(engine_.AddThumb(oid, thumb), VX_OK);
    }
    RunSteps(run.seed + 100, cut ? 100 : 50);
    ExpectAgreement(engine_, {}, cut);
  }
}

}  // namespace
