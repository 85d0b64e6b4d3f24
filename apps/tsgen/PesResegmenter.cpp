#include "PesResegmenter.h"

#include <algorithm>

namespace TavoPlayer::tsgen {

PesResegmenter::PesResegmenter(TsMuxer::Source source, size_t pesBytes)
    : mSource(std::move(source)), mPesBytes(std::max<size_t>(1, pesBytes)) {}

int PesResegmenter::next(PesUnit& unit) {
    while (!mEnded && mBytes.size() < mPesBytes) {
        PesUnit in;
        const int rc = mSource(in);
        if (rc < 0) {
            return rc;
        }
        if (rc == 1) {
            mEnded = true;
            break;
        }
        Start start{mBytes.size(), in};
        start.times.payload.clear();
        mBytes.insert(mBytes.end(), in.payload.begin(), in.payload.end());
        mStarts.push_back(std::move(start));
    }
    if (mBytes.empty()) {
        return 1;
    }
    const size_t take = std::min(mPesBytes, mBytes.size());
    unit.payload.assign(mBytes.begin(), mBytes.begin() + static_cast<std::ptrdiff_t>(take));
    mBytes.erase(mBytes.begin(), mBytes.begin() + static_cast<std::ptrdiff_t>(take));

    const bool startsHere = !mStarts.empty() && mStarts.front().offset < take;
    if (startsHere) {
        unit.pts = mStarts.front().times.pts;
        unit.dts = mStarts.front().times.dts;
        unit.hasDts = mStarts.front().times.hasDts;
        unit.randomAccess = mStarts.front().times.randomAccess;
        unit.aligned = mStarts.front().offset == 0;
        unit.hasPts = true;
    } else {
        // Only the continuation of an earlier unit: sent on that unit's schedule.
        unit.pts = mCurrent.pts;
        unit.dts = mCurrent.dts;
        unit.hasDts = mCurrent.hasDts;
        unit.randomAccess = false;
        unit.aligned = false;
        unit.hasPts = false;
    }
    // The last unit starting in this PES is the one the next byte belongs to.
    while (!mStarts.empty() && mStarts.front().offset < take) {
        mCurrent = mStarts.front().times;
        mStarts.pop_front();
    }
    for (auto& s : mStarts) {
        s.offset -= take;
    }
    return 0;
}

}  // namespace TavoPlayer::tsgen
