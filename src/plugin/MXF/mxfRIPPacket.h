// One body partition of a chunk: where its essence partition pack lies and where
// the partition carrying its index table segment lies.
#pragma once

#include "Object.h"

#include <cstdint>
#include <string>

class mxfRIPPacket : public Object {
public:
    static Ref<mxfRIPPacket> initWithEssenseBPPOffset(uint64_t essenseBPPOffset, uint64_t indexTableBPPOffset);

    uint64_t EssenseBPPOffset() const { return _EssenseBPPOffset; }
    uint64_t IndexTableBPPOffset() const { return _IndexTableBPPOffset; }
    std::string description() const override;

private:
    mxfRIPPacket(uint64_t e, uint64_t i) : _EssenseBPPOffset(e), _IndexTableBPPOffset(i) {}
    uint64_t _EssenseBPPOffset;
    uint64_t _IndexTableBPPOffset;
};
