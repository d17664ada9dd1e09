// Two shape records and a match setting from the input, through every match kernel. Each record
// lies alone in a heap block of exactly its size, so a read past its 400 cells (a neighbourhood
// reaching index 420, say) is caught by the address sanitizer. Scores must be a number from 0 to
// 100 or not a number, the portable and vector kernels must agree, the plain quick walks (on
// prepared records too) to the bit.
#include <cmath>
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <memory>

#include "MatchCSFuzzy.h"
#include "MatchCSQuick.h"
#include "MatchKernels.h"

namespace {

void Check(bool ok) {
  if (!ok) std::abort();
}

// Reads the input front to back and round again, so that a short input still fills two
// records that differ; an empty input reads as zeros.
class CReader {
 public:
  CReader(const uint8_t* data, size_t size) : data_(data), size_(size) {}
  void Read(void* out, size_t n) {
    auto* bytes = static_cast<uint8_t*>(out);
    for (size_t i = 0; i < n; ++i) bytes[i] = size_ ? data_[at_++ % size_] : 0;
  }
  template <typename T>
  T Get() {
    T v;
    Read(&v, sizeof v);
    return v;
  }

 private:
  const uint8_t* data_;
  size_t size_, at_ = 0;
};

void CheckScore(double score) { Check(std::isnan(score) || (score >= 0 && score <= 100)); }

void CheckSame(double a, double b) {
  Check(std::isnan(a) ? std::isnan(b) : std::fabs(a - b) <= 1e-9);
}

// The public kernel, and each implementation of it against the portable one.
void RunSet(const vxmatch::SKernelSet& portable, const vxmatch::SKernelSet* avx2,
            double (*kernel)(const SVXDBRec_3&, const SVXDBRec_3&, const SVXMatchParams&),
            const SVXDBRec_3& o, const SVXDBRec_3& c, const SVXMatchParams& p, bool compare) {
  const double score = portable.Pick(p)(vxmatch::CellBytes(o), vxmatch::CellBytes(c), p);
  CheckScore(score);
  CheckScore(kernel(o, c, p));
  if (avx2 && compare) {
    CheckSame(score, avx2->Pick(p)(vxmatch::CellBytes(o), vxmatch::CellBytes(c), p));
  }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  CReader in(data, size);
  SVXMatchParams p;
  // Percent weights; the large values a stream may hold make every cell fit.
  const uint8_t luma = in.Get<uint8_t>(), color = in.Get<uint8_t>();
  p.SetWeights(luma, color);
  const uint8_t flags = in.Get<uint8_t>();
  p.Fast = flags & 1;
  p.Rotate = flags & 2;
  p.Weighting = (flags >> 2) & 3;
  p.MinScore = in.Get<uint8_t>() * 0.5;
  SVXWeightMatrix weights;
  if (p.Weighting == 3) {
    uint8_t mask[400];
    in.Read(mask, sizeof mask);
    weights.SetMask(mask);
  } else {
    weights.Reset(p.Weighting);
  }
  p.Weights = &weights;
  auto o = std::make_unique<SVXDBRec_3>();
  auto c = std::make_unique<SVXDBRec_3>();
  in.Read(&o->Info, sizeof o->Info);
  in.Read(&c->Info, sizeof c->Info);

  // Where the early stop applies, implementations that sum in another order may decide a tie
  // with MinScore differently.
  const bool earlyStop = p.Weighted() && p.Fast && !p.Rotate;
  RunSet(vxmatch::PortableQuickKernels(), vxmatch::Avx2QuickKernels(), MatchCSQuick, *o, *c, p,
         !earlyStop);
  RunSet(vxmatch::PortableFuzzyKernels(), vxmatch::Avx2FuzzyKernels(), MatchCSFuzzy, *o, *c, p,
         true);
  CheckScore(MatchDuplicates(*o, *c, p));
  if (!p.Rotate && !p.Weighted()) {
    // Whatever the processor runs, and from prepared records, the plain walk gives the
    // portable result to the bit.
    const double portable =
        vxmatch::PortableQuickKernels().Pick(p)(vxmatch::CellBytes(*o), vxmatch::CellBytes(*c), p);
    for (double other :
         {MatchCSQuick(*o, *c, p),
          MatchCSQuickPrepared(PrepareQuick(*o, p.Fast), PrepareQuick(*c, p.Fast), p)}) {
      Check(other == portable || (std::isnan(other) && std::isnan(portable)));
    }
  }

  CHist ho, hc;
  ho.Build(o->Info, p.Weighting);
  hc.Build(c->Info, p.Weighting);
  double weight = 0;
  for (float bin : ho.Bins) weight += bin;
  CheckScore(MatchHistogram(ho, std::trunc(weight), hc));
  return 0;
}
