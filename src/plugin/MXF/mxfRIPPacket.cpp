#include "mxfRIPPacket.h"

#include <cstdio>

Ref<mxfRIPPacket> mxfRIPPacket::initWithEssenseBPPOffset(uint64_t essenseBPPOffset, uint64_t indexTableBPPOffset) {
    return Ref<mxfRIPPacket>(new mxfRIPPacket(essenseBPPOffset, indexTableBPPOffset));
}

std::string mxfRIPPacket::description() const {
    char buf[64];
    std::snprintf(buf, sizeof buf, "[%llx I:%llx]", static_cast<unsigned long long>(_EssenseBPPOffset),
                  static_cast<unsigned long long>(_IndexTableBPPOffset));
    return buf;
}
