// A fixed-seed random sequence of file and folder operations through the engine, after which the
// catalog and the other stores must agree: every listed file has its shape data and thumbnail,
// and no store holds data of a file the catalog lacks. The same sequence is also killed at a
// step, or in the middle of one, and the database reopened.
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

// What a step is doing, where a parent process can read it after the child was killed.
struct SProgress {
  int Step = -1;
  int Op = -1;
  uint32_t LastFileOid = 0;  // the catalog's counter before the step
  uint32_t Oid = 0;          // the file or folder the step removes
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
    progress.LastFileOid = engine_.Catalog().Header().LastFileOid;
    progress.Oid = 0;
    progress.Op = engine_.Catalog().NumberOfFolders() == 0 ? opAddFolder : op;
    if (engine_.Catalog().NumberOfFolders() == 0) return AddFolder("c:/root" + Number() + "/");
    switch (op) {
      case opAdd:
        return Add();
      case opAddReady:
        return AddReady();
      case opProperties:
        return Properties(AnyFile());
      case opMove:
        return Expect(engine_.MoveFile(AnyFile(), AnyFolder(), AnyName(), Coin()));
      case opCopy:
        return Copy();
      case opRename:
        return Expect(engine_.RenameFile(AnyFile(), AnyName()));
      case opReprocess:
        return Reprocess(AnyFile());
      case opRemove:
        return Expect(engine_.RemoveFile(progress.Oid = AnyFile()));
      case opAddFolder:
        return AddFolder(FolderURI(AnyFolder()) + "d" + Number() + "/");
      case opRenameFolder:
        return RenameFolder();
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

  void Copy() {
    unsigned long newOid = 0;
    Expect(engine_.CopyFile(AnyFile(), AnyFolder(), newOid, AnyName(), Coin()));
  }

  void Reprocess(uint32_t oid) {
    CVXCatFile file;
    Expect(engine_.GetFile(oid, file));
    CVXBitmap bitmap = vxtest::MakeBitmap(12, 12, Draw(1000));
    Expect(engine_.SetFile(file, &bitmap, Draw(1000)));
  }

  // To a free root, or merged into another folder when neither has sub-folders.
  void RenameFolder() {
    uint32_t from = AnyFolder();
    uint32_t into = AnyFolder();
    const auto& folders = engine_.Catalog().Folders();
    bool merge = Coin() && from != into && folders.at(from).Children().empty() &&
                 folders.at(into).Children().empty();
    CVXURI uri(merge ? FolderURI(into) : "c:/moved" + Number() + "/", true);
    Expect(engine_.RenameFolder(from, uri, "VOL", "1"));
  }

  void RemoveFolder(SProgress& progress) {
    if (engine_.Catalog().NumberOfFolders() <= 2) return;
    Expect(engine_.RemoveFolder(progress.Oid = AnyFolder()));
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

// Files that may lack data because the step in flight was cut short.
struct SExcuses {
  std::set<uint32_t> noData;   // listed, but their removal had begun
  std::set<uint32_t> noThumb;  // added from a bitmap, killed before the thumbnail came
};

// Checks both directions and returns how many records lie in the stores without a catalog
// record; those fail the test only when `orphansAllowed` is false.
size_t ExpectAgreement(ProbeEngine& engine, const SExcuses& excuses, bool orphansAllowed) {
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
  SExcuses ExcusesFor(const SProgress& p) {
    SExcuses excuses;
    if (p.Op == opAdd) {
      for (const auto& [oid, file] : engine_.Catalog().Files()) {
        if (oid > p.LastFileOid) excuses.noThumb.insert(oid);
      }
    } else if (p.Op == opRemove) {
      excuses.noData.insert(p.Oid);
    } else if (p.Op == opRemoveFolder) {
      // The catalog removes files before their folders, so every file still listed lies in a
      // folder that is still there; climb from it.
      const auto& folders = engine_.Catalog().Folders();
      for (const auto& [oid, file] : engine_.Catalog().Files()) {
        for (uint32_t f = file.Properties().Folder; f != 0 && folders.count(f);
             f = folders.at(f).ParentFolder()) {
          if (f == p.Oid) excuses.noData.insert(oid);
          if (f == p.Oid) break;
        }
      }
    }
    return excuses;
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
    // An interrupted removal is finished by removing again: the stores' misses do not stop it.
    for (uint32_t oid : excuses.noData) {
      if (!engine_.Catalog().IsUniqueFileOID(oid)) {
        EXPECT_EQ(engine_.RemoveFile(oid), VX_OK);
      }
    }
    ExpectAgreement(engine_, {{}, excuses.noThumb}, true);
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
