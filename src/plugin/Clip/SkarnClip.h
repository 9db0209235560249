// One clip on a Skarn card, built from its CLIP XML file or from a
// self-contained AVCLIP MXF file. The clip keeps its XML document for its whole
// life and answers its properties from it by XPath; format, duration, shooting
// rate, start timecode and metadata are fixed at construction.
#pragma once

#include "Bundle.h"
#include "Image.h"
#include "SkarnDate.h"
#include "SkarnVestaTimecode.h"
#include "Value.h"
#include "VestaKilnProtocols.h"
#include "XMLDocument.h"

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

using FourCharCode = uint32_t;

// Pulldown codes.
enum : int32_t {
    kSkarnPulldownUnknown = 0,
    kSkarnPulldownNone = 1,
    kSkarnPulldown23 = 2,
    kSkarnPulldown2332 = 3,
    kSkarnPulldown22 = 4,
};

// Timecode formats in the public numbering.
enum : int32_t {
    kSkarnTimecodeFormatDrop = 1,
    kSkarnTimecodeFormatNonDrop = 2,
};

class SkarnClip : public VestaKilnClipDataSourceProtocol {
public:
    ~SkarnClip() override;

    // Nil for a nil path, a file that is neither XML nor MXF, an unreadable
    // document, or a clip whose format or length cannot be established.
    static Ref<SkarnClip> initWithSkarnClip(const std::optional<std::string>& path);

    // The bundle clips localise their texts with; by default the one holding
    // this library. Tests and hosts that link the code directly point it at
    // the built bundle (nullptr restores the default).
    static void setDefaultBundle(Ref<Bundle> bundle);

    // ---- Document access
    XMLNode rootNode() const;
    std::optional<std::string> stringFromClipDescriptionForXPath(const std::string& xpath) const;

    // ---- Format (video format codes 0-26)
    int32_t videoFormat() const { return _videoFormat; }
    bool isMXFOp1bFormat() const { return _isMXFOp1bFormat; }
    bool isAVCI() const { return _videoFormat >= 15 && _videoFormat <= 26; }
    FourCharCode sourceFormat();
    std::optional<std::string> sourceFormatName();
    FourCharCode decodePixelFormat() const;
    std::string format();
    std::optional<std::string> displayFormat();
    uint32_t videoHeight();
    uint32_t videoWidth();
    std::optional<std::string> aspectRatio() const;
    bool anamorphic() const;
    int32_t videoBitrate();
    static bool recognizedVideoSampleSize(int64_t size);
    std::optional<std::string> clipID() override;
    std::optional<std::string> name() override;
    double videoDataSize();
    double dataSize();
    double startByteOffset();
    double dataSizeForAudioChannelIndex(uint32_t index);
    int32_t sampleRate() const;
    int32_t bitsPerSample() const;
    uint32_t numberOfAudioChannels() override;
    bool shouldRemoveDuplicateFramesAndPulldown() const { return false; }

    // ---- Timing
    double frameRate() const;
    double transportRate() override;
    double shootingRate() const { return _shootingRate.value_or(0.0); }
    int32_t pulldown();
    int32_t timecodeFormat() const;
    bool isDropFrame() override { return timecodeFormat() == kSkarnTimecodeFormatDrop; }
    // The start timecode object, and its text.
    Ref<SkarnVestaTimecode> __mediaStart() const { return _mediaStartTC; }
    Value mediaStart() override;
    // Frames (Null for none). durationNumber() is the same as a double.
    Value mediaDuration() override;
    std::optional<double> durationNumber() const { return _durationNumber; }
    // The normalised text of a "YYYY-MM-DDThh:mm:ss+hh:mm" date, with the date
    // it names and its zone; nil (and nil outputs) for texts too short to hold one.
    static std::optional<std::string> dateFromDateString(const std::optional<std::string>& text, Ref<SkarnDate>* outDate,
                                                         Ref<SkarnTimeZone>* outTimeZone);

    // ---- Card metadata
    std::optional<std::string> corvane_Skarn_startBinaryGroup() const;
    std::optional<std::string> corvane_Skarn_userClipName() const;
    std::optional<std::string> corvane_Skarn_dataSource() const;
    std::optional<std::string> corvane_Skarn_lastChangedBy() const;
    std::optional<std::string> corvane_Skarn_shooter() const;
    std::optional<std::string> corvane_Skarn_shootingAltitude() const;
    std::optional<std::string> corvane_Skarn_shootingLongitude() const;
    std::optional<std::string> corvane_Skarn_shootingLatitude() const;
    std::optional<std::string> corvane_Skarn_shootingLocationSource() const;
    std::optional<std::string> corvane_Skarn_shootingLocationName() const;
    std::optional<std::string> corvane_Skarn_programName() const;
    std::optional<std::string> corvane_Skarn_reporter() const;
    std::optional<std::string> corvane_Skarn_purpose() const;
    std::optional<std::string> corvane_Skarn_object() const;
    std::optional<std::string> scene() const;
    std::optional<std::string> shot() const;
    std::optional<std::string> creator() const;
    std::optional<std::string> deviceManufacturer() const;
    std::optional<std::string> deviceSerialNumber() const;
    std::optional<std::string> deviceModelName() const;
    std::optional<std::string> corvane_Skarn_shotMark() const;
    bool isGood() const;
    std::optional<std::string> corvane_Skarn_memo_text() const;
    std::optional<std::string> corvane_Skarn_memo_person() const;

    Ref<SkarnDate> creationDate() const;
    Ref<SkarnTimeZone> creationDateTimeZone() const;
    std::optional<std::string> creationDateString() const;
    Ref<SkarnDate> lastChangeDate() const;
    Ref<SkarnTimeZone> lastChangeDateTimeZone() const;
    std::optional<std::string> lastChangeDateString() const;
    Ref<SkarnDate> corvane_Skarn_shootingStartDate() const;
    std::optional<std::string> corvane_Skarn_shootingStartDateString() const;
    Ref<SkarnDate> corvane_Skarn_shootingEndDate() const;
    std::optional<std::string> corvane_Skarn_shootingEndDateString() const;

    // The format has no such fields.
    std::optional<std::string> reelName() const { return std::nullopt; }
    std::optional<std::string> logNote() const { return std::nullopt; }
    std::optional<std::string> clipDescription() const { return std::nullopt; }
    std::optional<std::string> angle() const { return std::nullopt; }

    // {"movie": [...], "track0": [...], ...} or Null.
    Value metadata() override { return _metadata; }
    Value extendedProperties() override;

    // ---- Files (nil when the folder or file is not there)
    std::optional<std::string> clipXMLPath() const { return _clipXMLPath; }
    std::optional<std::string> videoFilePath() const;
    std::optional<std::string> audioFolderPath() const;
    // Nil for a clip without audio channels.
    std::optional<std::vector<std::string>> audioFilePaths();
    std::optional<std::string> iconFilePath() const;
    std::optional<std::string> proxyFilePath() const;
    std::optional<std::string> proxyBinFilePath() const;
    std::optional<std::string> voiceFilePath() const;
    std::optional<std::string> spannedClipID() const;
    std::optional<std::string> nextClipIDInSpannedClip() const;
    std::optional<std::string> previousClipIDInSpannedClip() const;

    std::vector<std::string> clipURLs() override;
    // [[{"MediaSetPath": video}, {"MediaSetPath": audio 0}, ...]]
    Value ingestSourceFiles() override;
    bool isDeletable() override;
    bool deleteClip() override;

    Ref<VestaKilnFormatReaderProtocol> formatReader() override;
    bool useBuiltInFormatReader() override { return false; }
    Ref<VestaKilnIngestObject> ingestObject() override;
    void* ingestObjectRefCon() override { return this; }
    Ref<Image> posterFrame() override;
    Ref<Object> previewMovie() override { return createPreviewMovie(); }
    Ref<Object> createPreviewMovie() { return nullptr; }

    // ---- Properties by name
    // Every property above answers by its selector name (the accessor's name;
    // operations with arguments are not properties).
    bool respondsToSelector(std::string_view selector) const override;
    Value valueForKey(const std::string& key) override;

    std::string description() const override;

private:
    SkarnClip() = default;

    void initializeVideoFormat();
    void initializeDurationNumber();
    void initializeShootingRate();
    void initializeMediaStart();
    void initializeMetadata();

    std::optional<std::string> text(const char* xpath) const;
    std::optional<std::string> essenceListOrEssence(const char* essenceListPath, const char* essencePath) const;
    std::optional<std::string> memoList(const char* child) const;
    std::optional<std::string> dateString(const char* xpath) const;
    Ref<SkarnDate> date(const char* xpath) const;
    Ref<SkarnTimeZone> timeZone(const char* xpath) const;
    std::string localized(const std::string& key, const std::string& defaultValue) const;
    int64_t durationIntegerValue() const;
    std::string baseName() const;
    std::string contentsFolder() const;
    std::optional<std::string> cardFile(const char* folder, const char* extension) const;
    std::optional<std::string> companionClipXMLPath() const;

    // Answers kept while the clip is being built, when format detection,
    // rates, pulldown, timecode and metadata read the same paths and files
    // over and over; dropped before the clip is handed out.
    struct ConstructionMemo;

    std::string _clipXMLPath;
    Ref<XMLDocument> _clipXMLDocument;
    XMLNode _root;
    bool _isMXFOp1bFormat = false;
    int32_t _videoFormat = 0;
    int32_t _pulldown = kSkarnPulldownUnknown;
    std::optional<double> _shootingRate;
    Ref<SkarnVestaTimecode> _mediaStartTC;
    std::optional<double> _durationNumber;
    Value _metadata;
    Ref<Bundle> _bundle;
    Ref<VestaKilnIngestObject> _ingestObject;
    mutable std::unique_ptr<ConstructionMemo> _memo;
};

// One metadata entry {"reverseDNSName": key, "value": value} per key of the
// dictionary, in key order; nil for a non-dictionary.
Value SkarnUtilities_unpackageMetadataDictionary(const Value& dictionary);
