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

enum EOp {
  opAdd,
  opAddReady,
  opProperties,
  opMove,
  opCopy,
  opRename,
  opReprocess,
  opRemove,
  opAddFolder,
  opRenameFolder,
  opRemoveFolder,
  opBadTarget,
};

// What a step is doing, where a parent process can read it after the child was killed. The
// step fills it in before it calls the engine; the lists are plain arrays so that the whole
// lies in one shared mapping, with room for every file the sequences make.
struct SProgress {
  static constexpr uint32_t kMaxRemoved = 8192;
  static constexpr uint32_t kMaxLists = 4;

  int Step = -1;
  int Op = -1;
  uint32_t LastFileOid = 0;  // the catalog's counter before the step
  // Files the step removes: the file or the folder's files it removes, or the file that a move
  // or copy replaces.
  uint32_t NumRemoved = 0;
  uint32_t Removed[kMaxRemoved];
  // Folders that the step may leave listing a file that is no longer theirs. Moving a file, the
  // catalog stores the target's list, then the file's record, then the source's list; merging
  // folders, it stores the records of the source's files before the lists. Cut short, a moved
  // file can be in both lists, merged files in the source's list alone.
  uint32_t NumLists = 0;
  uint32_t Lists[kMaxLists];

  void Begin(int op, uint32_t lastFileOid) {
    NumRemoved = NumLists = 0;
    Op = op;
    LastFileOid = lastFileOid;
  }
  void Removes(uint32_t oid) {
    if (oid != 0 && NumRemoved < kMaxRemoved) Removed[NumRemoved++] = oid;
  }
  void Rewrites(uint32_t folder) {
    if (NumLists < kMaxLists) Lists[NumLists++] = folder;
  }
  std::set<uint32_t> RemovedSet() const { return {Removed, Removed + NumRemoved}; }
  std::set<uint32_t> ListsSet() const { return {Lists, Lists + NumLists}; }
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
    int op = PickOp();
    if (engine_.Catalog().NumberOfFiles() == 0 && op >= opProperties && op <= opRemove) {
      op = opAdd;
    }
    if (engine_.Catalog().NumberOfFolders() == 0) op = opAddFolder;
    progress.Begin(op, engine_.Catalog().Header().LastFileOid);
    if (engine_.Catalog().NumberOfFolders() == 0) return AddFolder("c:/root" + Number() + "/");
    switch (op) {
      case opAdd:
        return Add();
      case opAddReady:
        return AddReady();
      case opProperties:
        return Properties(AnyFile());
      case opMove:
        return Move(progress);
      case opCopy:
        return Copy(progress);
      case opRename:
        return Expect(engine_.RenameFile(AnyFile(), AnyName()));
      case opReprocess:
        return Reprocess(AnyFile());
      case opRemove:
        return Remove(progress);
      case opAddFolder:
        return AddFolder(FolderURI(AnyFolder()) + "d" + Number() + "/");
      case opRenameFolder:
        return RenameFolder(progress);
      case opRemoveFolder:
        return RemoveFolder(progress);
      default:
        return BadTarget();
    }
  }

  int unexpected = 0;

 private:
  int PickOp() {
    static const int kWeights[] = {25, 10, 8, 10, 10, 5, 5, 12, 7, 3, 3, 2};
    std::discrete_distribution<int> d(std::begin(kWeights), std::end(kWeights));
    return d(rng_);
  }
  uint32_t Draw(uint32_t n) { return std::uniform_int_distribution<uint32_t>(0, n - 1)(rng_); }
  bool Coin() { return Draw(2) == 0; }
  std::string Number() { return std::to_string(counter_++); }
  void Expect(unsigned rc) { unexpected += rc != VX_OK; }

  template <typename Map>
  uint32_t Any(const Map& map) {
    if (map.empty()) return 0;
    auto it = map.begin();
    std::advance(it, Draw(static_cast<uint32_t>(map.size())));
    return it->first;
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
      if (oid != skip && file != files.end() &&
          CVXCatFile::CompareNames(file->second.Name(), name) == 0) {
        return oid;
      }
    }
    return 0;
  }

  void AddFolder(const std::string& uri) {
    CVXFolder folder(CVXURI(uri, true), 0, 0);
    folder.MediaID() = "VOL";
    folder.MediaSerial() = "1";
    Expect(engine_.AddFolder(folder));
  }

  void Add() {
    uint32_t seed = Draw(1000);
    CVXCatFile file(0, AnyName(), AnyFolder());
    Expect(engine_.AddFile(file, vxtest::MakeBitmap(16, 12, seed), seed));
    CVXThumb thumb = vxtest::MakeThumb(40, 30, 200 + seed, static_cast<uint8_t>(seed));
    Expect(engine_.AddThumb(file.Oid(), thumb));
    if (Coin()) Properties(file.Oid());
  }

  void AddReady() {
    uint32_t seed = Draw(1000);
    CVXCatFile file(0, AnyName(), AnyFolder());
    CVXThumb thumb = vxtest::MakeThumb(30, 40, 100 + seed, static_cast<uint8_t>(seed));
    Expect(engine_.AddFile(file, thumb, vxtest::MakeShape(static_cast<uint8_t>(seed))));
  }

  void Properties(uint32_t oid) {
    switch (Draw(4)) {
      case 0:
        return Expect(engine_.SetImageProperties(oid, vxtest::MakeRow(oid, kColumns)));
      case 1:
        return Expect(engine_.RemoveImageProperties(oid));
      case 2: {
        SXMPRecord rec;
        rec.Oid = oid;
        rec.Packet = "<xmp " + Number() + "/>";
        rec.Rating = 1 + static_cast<int32_t>(Draw(5));
        Expect(engine_.SetXMP(&rec, false));
        return Expect(engine_.SetXMPFTI(oid, {{"dc:subject", rec.Packet}}));
      }
      default:
        return Expect(engine_.DeleteXMP(oid));
    }
  }

  void Move(SProgress& progress) {
    uint32_t oid = AnyFile();
    uint32_t folder = AnyFolder();
    std::string name = AnyName();
    progress.Rewrites(engine_.Catalog().Files().at(oid).Properties().Folder);
    progress.Rewrites(folder);
    progress.Removes(InTheWay(folder, name, oid));
    Expect(engine_.MoveFile(oid, folder, name, Coin()));
  }

  void Copy(SProgress& progress) {
    uint32_t oid = AnyFile();
    uint32_t folder = AnyFolder();
    std::string name = AnyName();
    progress.Removes(InTheWay(folder, name, 0));
    unsigned long newOid = 0;
    Expect(engine_.CopyFile(oid, folder, newOid, name, Coin()));
  }

  void Remove(SProgress& progress) {
    uint32_t oid = AnyFile();
    progress.Removes(oid);
    Expect(engine_.RemoveFile(oid));
  }

  void Reprocess(uint32_t oid) {
    CVXCatFile file;
    Expect(engine_.GetFile(oid, file));
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
    if (merge) progress.Rewrites(from);
    CVXURI uri(merge ? FolderURI(into) : "c:/moved" + Number() + "/", true);
    Expect(engine_.RenameFolder(from, uri, "VOL", "1"));
  }

  // The files are those of the folders' lists, which the engine and the catalog walk.
  void RemoveFolder(SProgress& progress) {
    if (engine_.Catalog().NumberOfFolders() <= 2) return;
    uint32_t oid = AnyFolder();
    const auto& folders = engine_.Catalog().Folders();
    std::vector<uint32_t> tree{oid};
    for (size_t i = 0; i < tree.size(); ++i) {
      auto folder = folders.find(tree[i]);
      if (folder == folders.end()) continue;
      for (uint32_t file : folder->second.Files()) progress.Removes(file);
      tree.insert(tree.end(), folder->second.Children().begin(), folder->second.Children().end());
    }
    Expect(engine_.RemoveFolder(oid));
  }

  // Operations aimed at what is not there fail and must leave nothing behind.
  void BadTarget() {
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

// Checks both directions and the folders' lists, and returns how many records lie in the
// stores without a catalog record; those fail the test only when `orphansAllowed` is false.
size_t ExpectAgreement(ProbeEngine& engine, const SExcuses& excuses, bool orphansAllowed) {
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
  size_t orphans = 0;
  for (const auto* store : {&c.shapes, &c.thumbs, &c.properties, &c.xmp}) {
    for (uint32_t oid : *store) {
      if (files.count(oid)) continue;
      ++orphans;
      EXPECT_TRUE(orphansAllowed) << "data of file " << oid << " without a catalog record";
    }
  }
  return orphans;
}

class EngineConsistencyTest : public vxtest::EngineFixture {
 protected:
  void SetUp() override {
    EngineFixture::SetUp();
    engine_.SetLogFile(nullptr);  // thousands of operations: the log would dominate the time
    vxtest::DefineColumns(engine_, kColumns);
  }

  // Runs `steps` steps of the sequence in a child process on its own engine and kills it with
  // SIGKILL: after the last step, or with `killAfterMicros` set, from here once that time has
  // passed, wherever the child stands. Returns the child's last progress.
  SProgress RunInChild(uint32_t seed, int steps, long killAfterMicros = 0) {
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
    excuses.lists = p.ListsSet();
    if (p.Op == opAdd) {
      for (const auto& [oid, file] : engine_.Catalog().Files()) {
        if (oid > p.LastFileOid) excuses.noThumb.insert(oid);
      }
    } else if (p.Op == opRemove || p.Op == opRemoveFolder) {
      excuses.noData = p.RemovedSet();
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
    bool dataFirst = p.Op == opRemove || p.Op == opRemoveFolder;
    for (uint32_t oid : p.RemovedSet()) {
      if (!catalog.IsUniqueFileOID(oid) && (dataFirst || !listed.count(oid))) {
        EXPECT_EQ(engine_.RemoveFile(oid), VX_OK) << oid;
      }
    }
    std::set<uint32_t> listingOthers = FoldersListingOthers(catalog);
    for (uint32_t oid : p.ListsSet()) {
      if (!listingOthers.count(oid)) continue;
      CVXFolder folder = catalog.Folders().at(oid);
      std::erase_if(folder.Files(), [&](uint32_t file) { return !Owns(catalog, oid, file); });
      EXPECT_EQ(engine_.SetFolder(folder), VX_OK) << oid;
    }
  }
};

TEST_F(EngineConsistencyTest, RandomSequenceKeepsTheStoresInAgreement) {
  Sequence sequence(engine_, 2024);
  sequence.Start();
  SProgress progress;
  for (int i = 0; i < 2000; ++i) sequence.Step(progress);
  EXPECT_EQ(sequence.unexpected, 0);
  EXPECT_GT(engine_.Catalog().NumberOfFiles(), 50u);
  ExpectAgreement(engine_, {}, false);
  Reopen();
  ExpectAgreement(engine_, {}, false);
}

TEST_F(EngineConsistencyTest, KilledBetweenStepsTheReopenedStoresAgree) {
  std::mt19937 rng(1601);  // the kill steps are drawn, the draw is fixed
  for (uint32_t seed : {7u, 8u, 9u}) {
    const int steps = std::uniform_int_distribution<int>(1, 1999)(rng);
    SCOPED_TRACE("seed " + std::to_string(seed) + " killed after step " + std::to_string(steps));
    RunInChild(seed, steps);
    // Every step before the kill had returned, and each write survives a crash of the process.
    ExpectAgreement(engine_, {}, false);
    // The database goes on from where the crash left it.
    Sequence more(engine_, seed + 100);
    SProgress progress;
    for (int i = 0; i < 50; ++i) more.Step(progress);
    EXPECT_EQ(more.unexpected, 0);
    ExpectAgreement(engine_, {}, false);
  }
}

TEST_F(EngineConsistencyTest, KilledInsideAStepOnlyThatStepIsHalfDone) {
  const std::pair<uint32_t, long> runs[] = {{21, 30000}, {22, 90000}, {23, 170000}};
  for (auto [seed, micros] : runs) {
    SCOPED_TRACE("seed " + std::to_string(seed) + " killed after " + std::to_string(micros) +
                 " us");
    // More steps than the child can take before the kill, so that it always lands in one.
    SProgress p = RunInChild(seed, 1 << 30, micros);
    EXPECT_GE(p.Step, 0);
    SExcuses excuses = ExcusesFor(p);
    ExpectAgreement(engine_, excuses, true);
    FinishStep(p);
    ExpectAgreement(engine_, {{}, excuses.noThumb, {}}, true);
    // The host gives the new file its thumbnail, as it would have; work goes on, and what the
    // cut step left behind takes nothing from new files.
    for (uint32_t oid : excuses.noThumb) {
      CVXThumb thumb = vxtest::MakeThumb(40, 30, 64, 1);
      EXPECT_EQ(engine_.AddThumb(oid, thumb), VX_OK);
    }
    Sequence more(engine_, seed + 100);
    SProgress progress;
    for (int i = 0; i < 100; ++i) more.Step(progress);
    EXPECT_EQ(more.unexpected, 0);
    ExpectAgreement(engine_, {}, true);
  }
}

}  // namespace
