#include "CMAttachmentBearer.h"

void CMAttachmentBearer::setAttachment(const std::string& key, const Value& value, CMAttachmentMode mode) {
    if (value.isNull()) return removeAttachment(key);
    if (mode != kCMAttachmentMode_ShouldNotPropagate && mode != kCMAttachmentMode_ShouldPropagate) return;
    std::lock_guard<std::mutex> lock(_attachmentLock);
    Dictionary& into = mode == kCMAttachmentMode_ShouldPropagate ? _propagating : _notPropagating;
    Dictionary& other = mode == kCMAttachmentMode_ShouldPropagate ? _notPropagating : _propagating;
    other.remove(key);
    into.set(key, value);
}

Value CMAttachmentBearer::attachment(const std::string& key, CMAttachmentMode* modeOut) const {
    std::lock_guard<std::mutex> lock(_attachmentLock);
    if (const Value* v = _propagating.find(key)) {
        if (modeOut) *modeOut = kCMAttachmentMode_ShouldPropagate;
        return *v;
    }
    if (const Value* v = _notPropagating.find(key)) {
        if (modeOut) *modeOut = kCMAttachmentMode_ShouldNotPropagate;
        return *v;
    }
    return Value();
}

void CMAttachmentBearer::removeAttachment(const std::string& key) {
    std::lock_guard<std::mutex> lock(_attachmentLock);
    _propagating.remove(key);
    _notPropagating.remove(key);
}

void CMAttachmentBearer::removeAllAttachments() {
    std::lock_guard<std::mutex> lock(_attachmentLock);
    _propagating = Dictionary();
    _notPropagating = Dictionary();
}

Dictionary CMAttachmentBearer::attachments(CMAttachmentMode mode) const {
    std::lock_guard<std::mutex> lock(_attachmentLock);
    if (mode == kCMAttachmentMode_ShouldPropagate) return _propagating;
    if (mode == kCMAttachmentMode_ShouldNotPropagate) return _notPropagating;
    return Dictionary();
}

void CMSetAttachment(const CMAttachmentBearerRef& target, const std::string& key, const Value& value,
                     CMAttachmentMode attachmentMode) {
    if (target) target->setAttachment(key, value, attachmentMode);
}

Value CMGetAttachment(const CMAttachmentBearerRef& target, const std::string& key, CMAttachmentMode* attachmentModeOut) {
    return target ? target->attachment(key, attachmentModeOut) : Value();
}

void CMRemoveAttachment(const CMAttachmentBearerRef& target, const std::string& key) {
    if (target) target->removeAttachment(key);
}

void CMRemoveAllAttachments(const CMAttachmentBearerRef& target) {
    if (target) target->removeAllAttachments();
}

Dictionary CMCopyDictionaryOfAttachments(CFAllocatorRef, const CMAttachmentBearerRef& target,
                                         CMAttachmentMode attachmentMode) {
    return target ? target->attachments(attachmentMode) : Dictionary();
}

void CMSetAttachments(const CMAttachmentBearerRef& target, const Dictionary& theAttachments,
                      CMAttachmentMode attachmentMode) {
    if (!target) return;
    for (const auto& [key, value] : theAttachments) target->setAttachment(key, value, attachmentMode);
}

void CMPropagateAttachments(const CMAttachmentBearerRef& source, const CMAttachmentBearerRef& destination) {
    if (!source || !destination || source == destination) return;
    CMSetAttachments(destination, source->attachments(kCMAttachmentMode_ShouldPropagate),
                     kCMAttachmentMode_ShouldPropagate);
}
