// The clip's pull-model ingest object. The host initialises and starts it,
// then asks for media again and again; each call delivers the next video
// frame and the next block of every audio channel in the older media record,
// as pointers into memory the buffer manager keeps until the host disposes
// of it, until video and audio are both at their end.
//
// On initialise it reads the first frames to find the clip's pulldown
// cadence, so that repeated frames are dropped and the rest delivered at the
// shooting rate.
#pragma once

#include "CFDictionary.h"
#include "CMTime.h"
#include "SkarnBufferManager.h"
#include "SkarnCadenceReading.h"
#include "SkarnFormatReader.h"
#include "SkarnMediaReader.h"
#include "VestaKilnProtocols.h"

#include <cstdint>
#include <vector>

class SkarnClip;

class SkarnIngestObject : public VestaKilnIngestObject {
public:
    // The clip owns its ingest object; the object points back without
    // retaining it.
    static Ref<SkarnIngestObject> initWithClip(SkarnClip* clip);
    ~SkarnIngestObject() override;

    int32_t initialize(void* refCon) override;
    int32_t reset(void* refCon) override;
    int32_t teardown(void* refCon) override;
    int32_t start(void* refCon) override;
    int32_t stop(void* refCon) override;
    int32_t cleanup(void* refCon) override;
    int32_t setPathSet(const Value& pathSet, void* refCon) override { return 0; }
    int32_t setInPoint(CMTime inPoint, void* refCon) override;
    int32_t setOutPoint(CMTime outPoint, void* refCon) override { return 0; }
    int32_t setKeepMediaVideoRate(bool keepMediaRate, void* refCon) override;
    // Media goes out only through the older record, deliberately.
    int32_t getNextMedia(VestaKilnPlugInMediaSpecifier* media, void* refCon) override { return 0; }
    int32_t getNextMedia_Deprecated(VestaKilnPlugInMediaSpecifier_Deprecated* media, void* refCon) override;
    bool usesCMTime() override { return true; }

    void setUseTimingOffset(bool use) { _useTimingOffset = use; }
    SkarnClip* clip() const { return _clip; }
    SkarnMediaReader* videoReader() const { return _videoReader.get(); }
    const std::vector<Ref<SkarnMediaReader>>& audioReaders() const { return _audioReaders; }
    SkarnMediaReader* firstAudioReader() const { return _audioReaders.empty() ? nullptr : _audioReaders.front().get(); }
    SkarnBufferManager* bufferManager() const { return _bufferManager.get(); }
    const Dictionary& durationDict() const { return _durationDict; }
    // What the last cadence reading concluded (nothing before initialize).
    const SkarnCadenceReading& cadenceReading() const { return _cadenceReading; }

private:
    SkarnIngestObject() = default;

    void determineCadence();
    bool anyAudioHasData() const;
    void deliverVideo(VestaKilnPlugInMediaSpecifier_Deprecated* media, int32_t* status, bool* delivered);
    void deliverAudio(VestaKilnPlugInMediaSpecifier_Deprecated* media, bool videoDelivered, int32_t* status,
                      bool* delivered);

    SkarnClip* _clip = nullptr;
    Ref<SkarnFormatReader> _formatReader;
    Ref<SkarnMediaReader> _videoReader;
    std::vector<Ref<SkarnMediaReader>> _audioReaders;
    bool _videoEndOfData = false;
    bool _audioEndOfData = false;
    Ref<SkarnBufferManager> _bufferManager;
    bool _keepMediaRate = false;
    int64_t _timecodeCounter = 0;
    CMTime _frameDuration = kCMTimeInvalid;
    int64_t _frameQuanta = 0;
    bool _isDropFrame = false;
    CMTime _startTime = kCMTimeZero;
    CMTime _fakeStartTime = kCMTimeZero;
    bool _firstFrame = true;
    Dictionary _durationDict;
    bool _useTimingOffset = true;
    SkarnCadenceReading _cadenceReading;
};
