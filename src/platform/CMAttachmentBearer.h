// Keyed attachments on media objects (sample buffers), with a propagation mode.
//
// The frameworks attach through an untyped reference and a per-type callback
// table; here every attachment-bearing class derives from CMAttachmentBearer,
// which keeps the attachments under its own lock, so that a host thread may
// read them while the ingest thread sets others.
#pragma once

#include "CFBase.h"
#include "Object.h"
#include "Value.h"

#include <mutex>
#include <string>

using CMAttachmentMode = uint32_t;
enum : CMAttachmentMode {
    kCMAttachmentMode_ShouldNotPropagate = 0,
    kCMAttachmentMode_ShouldPropagate = 1,
};

class CMAttachmentBearer : public Object {
public:
    // A Null value removes the key; an unknown mode leaves things as they are.
    void setAttachment(const std::string& key, const Value& value, CMAttachmentMode mode);
    // Null when absent; *modeOut is left alone then.
    Value attachment(const std::string& key, CMAttachmentMode* modeOut) const;
    void removeAttachment(const std::string& key);
    void removeAllAttachments();
    // The attachments set with the mode, in the order they were first set.
    Dictionary attachments(CMAttachmentMode mode) const;

protected:
    CMAttachmentBearer() = default;

private:
    mutable std::mutex _attachmentLock;
    Dictionary _propagating;
    Dictionary _notPropagating;
};

using CMAttachmentBearerRef = Ref<CMAttachmentBearer>;

// Null targets are ignored (getters answer Null / an empty dictionary).
void CMSetAttachment(const CMAttachmentBearerRef& target, const std::string& key, const Value& value,
                     CMAttachmentMode attachmentMode);
Value CMGetAttachment(const CMAttachmentBearerRef& target, const std::string& key, CMAttachmentMode* attachmentModeOut);
void CMRemoveAttachment(const CMAttachmentBearerRef& target, const std::string& key);
void CMRemoveAllAttachments(const CMAttachmentBearerRef& target);
Dictionary CMCopyDictionaryOfAttachments(CFAllocatorRef allocator, const CMAttachmentBearerRef& target,
                                         CMAttachmentMode attachmentMode);
void CMSetAttachments(const CMAttachmentBearerRef& target, const Dictionary& theAttachments,
                      CMAttachmentMode attachmentMode);
// Copies the source's propagating attachments onto the destination.
void CMPropagateAttachments(const CMAttachmentBearerRef& source, const CMAttachmentBearerRef& destination);
