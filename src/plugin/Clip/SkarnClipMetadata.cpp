// SkarnClip's metadata: the card metadata fields of the clip XML, its dates
// and memos, the metadata dictionary built at construction from the MXF
// header metadata and the card fields, and the extended properties shown
// beside them.
#include "SkarnClip.h"

#include "SkarnClipInternal.h"
#include "SkarnMXFMetadata.h"

#include <cctype>
#include <cstdio>

using namespace SkarnClipInternal;

namespace {

std::string upperCased(std::string s) {
    for (char& c : s) c = char(std::toupper(static_cast<unsigned char>(c)));
    return s;
}

// The 27 card metadata keys (after "com.corvane.professionalplugin.skarn.")
// and the accessors whose values they publish, in entry order.
struct CardMetadataRow {
    const char* keySuffix;
    const char* accessor;
};
constexpr CardMetadataRow kCardMetadataMap[] = {
    {"essencelist.video.startbinarygroup", "corvane_Skarn_startBinaryGroup"},
    {"clipmetadata.userclipname", "corvane_Skarn_userClipName"},
    {"clipmetadata.memo.person", "corvane_Skarn_memo_person"},
    {"clipmetadata.memo.text", "corvane_Skarn_memo_text"},
    {"clipmetadata.datasource", "corvane_Skarn_dataSource"},
    {"clipmetadata.shotmark", "corvane_Skarn_shotMark"},
    {"clipmetadata.access.lastupdateperson", "corvane_Skarn_lastChangedBy"},
    {"clipmetadata.shoot.shooter", "corvane_Skarn_shooter"},
    {"clipmetadata.shoot.startdate", "corvane_Skarn_shootingStartDateString"},
    {"clipmetadata.shoot.enddate", "corvane_Skarn_shootingEndDateString"},
    {"clipmetadata.shoot.location.altitude", "corvane_Skarn_shootingAltitude"},
    {"clipmetadata.shoot.location.longitude", "corvane_Skarn_shootingLongitude"},
    {"clipmetadata.shoot.location.latitude", "corvane_Skarn_shootingLatitude"},
    {"clipmetadata.shoot.location.source", "corvane_Skarn_shootingLocationSource"},
    {"clipmetadata.shoot.location.placename", "corvane_Skarn_shootingLocationName"},
    {"clipmetadata.scenario.programname", "corvane_Skarn_programName"},
    {"clipmetadata.news.reporter", "corvane_Skarn_reporter"},
    {"clipmetadata.news.purpose", "corvane_Skarn_purpose"},
    {"clipmetadata.news.object", "corvane_Skarn_object"},
    {"clipmetadata.scenario.sceneno", "scene"},
    {"clipmetadata.scenario.takeno", "shot"},
    {"clipmetadata.access.creator", "creator"},
    {"clipmetadata.access.creationdate", "creationDateString"},
    {"clipmetadata.access.lastupdatedate", "lastChangeDateString"},
    {"clipmetadata.device.manufacturer", "deviceManufacturer"},
    {"clipmetadata.device.serialno", "deviceSerialNumber"},
    {"clipmetadata.device.modelname", "deviceModelName"},
};

struct ExtendedPropertyRow {
    const char* identifier;
    const char* label;
};
constexpr ExtendedPropertyRow kExtendedProperties[] = {
    {"corvane_Skarn_dataSource", "Data Source"},
    {"corvane_Skarn_shootingLongitude", "Longitude"},
    {"corvane_Skarn_shootingLatitude", "Latitude"},
    {"corvane_Skarn_shooter", "Shot By"},
    {"corvane_Skarn_shootingStartDate", "Shooting Start Date"},
    {"corvane_Skarn_shootingEndDate", "Shooting End Date"},
    {"corvane_Skarn_shootingLocationSource", "Location Source"},
    {"corvane_Skarn_shootingLocationName", "Location Name"},
    {"corvane_Skarn_programName", "Program Name"},
    {"corvane_Skarn_reporter", "Reporter"},
    {"corvane_Skarn_purpose", "Purpose"},
    {"corvane_Skarn_object", "Object"},
    {"corvane_Skarn_lastChangedBy", "Modified By"},
    {"corvane_Skarn_startBinaryGroup", "User Information"},
    {"corvane_Skarn_memo_text", "Memo"},
    {"corvane_Skarn_memo_person", "Memo Created By"},
};

// The platform's truncate-middle line break mode.
constexpr int kLineBreakByTruncatingMiddle = 4;

// {"reverseDNSName": key, "value": value}, built by moves: an initialiser list
// would copy every value twice, for each of a card's hundreds of entries.
Value metadataEntry(std::string key, Value value) {
    Dictionary d;
    d.set("reverseDNSName", Value(std::move(key)));
    d.set("value", std::move(value));
    return Value(std::move(d));
}

}  // namespace

std::optional<std::string> SkarnClip::corvane_Skarn_startBinaryGroup() const {
    return text("ClipContent/EssenceList/Video/StartBinaryGroup");
}
std::optional<std::string> SkarnClip::corvane_Skarn_userClipName() const {
    return text("ClipContent/ClipMetadata/UserClipName");
}
std::optional<std::string> SkarnClip::corvane_Skarn_dataSource() const { return text("ClipContent/ClipMetadata/DataSource"); }
std::optional<std::string> SkarnClip::corvane_Skarn_lastChangedBy() const {
    return text("ClipContent/ClipMetadata/Access/LastUpdatePerson");
}
std::optional<std::string> SkarnClip::corvane_Skarn_shooter() const { return text("ClipContent/ClipMetadata/Shoot/Shooter"); }
std::optional<std::string> SkarnClip::corvane_Skarn_shootingAltitude() const {
    return text("ClipContent/ClipMetadata/Shoot/Location/Altitude");
}
std::optional<std::string> SkarnClip::corvane_Skarn_shootingLongitude() const {
    return text("ClipContent/ClipMetadata/Shoot/Location/Longitude");
}
std::optional<std::string> SkarnClip::corvane_Skarn_shootingLatitude() const {
    return text("ClipContent/ClipMetadata/Shoot/Location/Latitude");
}
std::optional<std::string> SkarnClip::corvane_Skarn_shootingLocationSource() const {
    return text("ClipContent/ClipMetadata/Shoot/Location/Source");
}
std::optional<std::string> SkarnClip::corvane_Skarn_shootingLocationName() const {
    return text("ClipContent/ClipMetadata/Shoot/Location/PlaceName");
}
std::optional<std::string> SkarnClip::corvane_Skarn_programName() const {
    return text("ClipContent/ClipMetadata/Scenario/ProgramName");
}
std::optional<std::string> SkarnClip::corvane_Skarn_reporter() const { return text("ClipContent/ClipMetadata/News/Reporter"); }
std::optional<std::string> SkarnClip::corvane_Skarn_purpose() const { return text("ClipContent/ClipMetadata/News/Purpose"); }
std::optional<std::string> SkarnClip::corvane_Skarn_object() const { return text("ClipContent/ClipMetadata/News/Object"); }
std::optional<std::string> SkarnClip::scene() const { return text("ClipContent/ClipMetadata/Scenario/SceneNo."); }
std::optional<std::string> SkarnClip::shot() const { return text("ClipContent/ClipMetadata/Scenario/TakeNo."); }
std::optional<std::string> SkarnClip::creator() const { return text("ClipContent/ClipMetadata/Access/Creator"); }
std::optional<std::string> SkarnClip::deviceManufacturer() const {
    return text("ClipContent/ClipMetadata/Device/Manufacturer");
}
std::optional<std::string> SkarnClip::deviceSerialNumber() const { return text("ClipContent/ClipMetadata/Device/SerialNo."); }
std::optional<std::string> SkarnClip::deviceModelName() const { return text("ClipContent/ClipMetadata/Device/ModelName"); }

std::optional<std::string> SkarnClip::corvane_Skarn_shotMark() const {
    auto t = text("ClipContent/ClipMetadata/ShotMark");
    if (!t) return std::nullopt;
    return upperCased(*t);
}

bool SkarnClip::isGood() const { return ciEquals(text("ClipContent/ClipMetadata/ShotMark"), "true"); }

std::optional<std::string> SkarnClip::memoList(const char* child) const {
    if (!_root) return std::nullopt;
    std::string error;
    auto memos = _root.nodesForXPath("ClipContent/ClipMetadata/MemoList/Memo", &error);
    if (!memos || memos->empty()) return std::nullopt;
    std::optional<std::string> result;
    for (const XMLNode& memo : *memos) {
        auto items = memo.nodesForXPath(child, &error);
        if (!items) break;
        if (items->empty()) continue;
        std::string t = items->front().stringValue();
        if (!result) result = std::move(t);
        else if (!t.empty()) *result += "/ " + t;
    }
    return result;
}

std::optional<std::string> SkarnClip::corvane_Skarn_memo_text() const { return memoList("Text"); }
std::optional<std::string> SkarnClip::corvane_Skarn_memo_person() const { return memoList("Person"); }

std::optional<std::string> SkarnClip::dateString(const char* xpath) const {
    return dateFromDateString(text(xpath), nullptr, nullptr);
}
Ref<SkarnDate> SkarnClip::date(const char* xpath) const {
    Ref<SkarnDate> d;
    dateFromDateString(text(xpath), &d, nullptr);
    return d;
}
Ref<SkarnTimeZone> SkarnClip::timeZone(const char* xpath) const {
    Ref<SkarnTimeZone> z;
    dateFromDateString(text(xpath), nullptr, &z);
    return z;
}

#define SKARN_DATE_PATH_CREATION "ClipContent/ClipMetadata/Access/CreationDate"
#define SKARN_DATE_PATH_LASTUPDATE "ClipContent/ClipMetadata/Access/LastUpdateDate"
#define SKARN_DATE_PATH_START "ClipContent/ClipMetadata/Shoot/StartDate"
#define SKARN_DATE_PATH_END "ClipContent/ClipMetadata/Shoot/EndDate"

Ref<SkarnDate> SkarnClip::creationDate() const { return date(SKARN_DATE_PATH_CREATION); }
Ref<SkarnTimeZone> SkarnClip::creationDateTimeZone() const { return timeZone(SKARN_DATE_PATH_CREATION); }
std::optional<std::string> SkarnClip::creationDateString() const { return dateString(SKARN_DATE_PATH_CREATION); }
Ref<SkarnDate> SkarnClip::lastChangeDate() const { return date(SKARN_DATE_PATH_LASTUPDATE); }
Ref<SkarnTimeZone> SkarnClip::lastChangeDateTimeZone() const { return timeZone(SKARN_DATE_PATH_LASTUPDATE); }
std::optional<std::string> SkarnClip::lastChangeDateString() const { return dateString(SKARN_DATE_PATH_LASTUPDATE); }
Ref<SkarnDate> SkarnClip::corvane_Skarn_shootingStartDate() const { return date(SKARN_DATE_PATH_START); }
std::optional<std::string> SkarnClip::corvane_Skarn_shootingStartDateString() const {
    return dateString(SKARN_DATE_PATH_START);
}
Ref<SkarnDate> SkarnClip::corvane_Skarn_shootingEndDate() const { return date(SKARN_DATE_PATH_END); }
std::optional<std::string> SkarnClip::corvane_Skarn_shootingEndDateString() const {
    return dateString(SKARN_DATE_PATH_END);
}

std::optional<std::string> SkarnClip::dateFromDateString(const std::optional<std::string>& text,
                                                         Ref<SkarnDate>* outDate, Ref<SkarnTimeZone>* outTimeZone) {
    if (outDate) *outDate = nullptr;
    if (outTimeZone) *outTimeZone = nullptr;
    // Shorter texts cannot hold date, time and zone at the fixed positions read below.
    if (!text || text->size() < 23) return std::nullopt;
    const std::string& s = *text;
    const std::string zone = s.substr(19);
    std::string composed = s.substr(0, 10) + " " + s.substr(11, 8) + " " + zone.substr(0, 3) + zone.substr(4);
    if (outDate) *outDate = SkarnDate::dateFromString(composed);
    // The minutes are added whatever the sign of the hours, so -05:30 comes
    // out as -04:30 (-16200 s); kept, as clips have always been read so.
    const int64_t seconds = int64_t(intValue(zone.substr(0, 3))) * 3600 + int64_t(intValue(zone.substr(4))) * 60;
    if (outTimeZone) *outTimeZone = SkarnTimeZone::timeZoneForSecondsFromGMT(seconds);
    return composed;
}

Value SkarnUtilities_unpackageMetadataDictionary(const Value& dictionary) {
    if (!dictionary.isDictionary()) return Value();
    Array entries;
    entries.reserve(dictionary.dictionary().size());
    for (const auto& [key, value] : dictionary.dictionary()) entries.push_back(metadataEntry(key, value));
    return Value(std::move(entries));
}

void SkarnClip::initializeMetadata() {
    Value m = SkarnMXFMetadataForClip(this);
    if (!m.isArray()) {
        _metadata = Value();
        return;
    }
    Array cardEntries;
    for (const CardMetadataRow& row : kCardMetadataMap) {
        if (!respondsToSelector(row.accessor)) continue;
        Value v = valueForKey(row.accessor);
        if (v.isNull()) continue;
        cardEntries.push_back(
            metadataEntry(std::string("com.corvane.professionalplugin.skarn.") + row.keySuffix, Value(v.description())));
    }
    if (m.count() == 0) {
        _metadata = Value();
        return;
    }
    const Value& d0 = m[size_t(0)];
    const Value& identifications = d0["identifications"];
    const Value& materials = d0["materialPackages"];
    Array movie;
    auto append = [&](const Value& dictionary) {
        Value entries = SkarnUtilities_unpackageMetadataDictionary(dictionary);
        for (const Value& e : entries.arrayValue()) movie.push_back(e);
    };
    if (identifications.count() > 0) append(identifications[identifications.count() - 1]);
    if (materials.count() > 0) append(materials[size_t(0)]);
    for (Value& e : cardEntries) movie.push_back(std::move(e));

    Dictionary metadata;
    metadata.set("movie", Value(std::move(movie)));
    for (size_t i = 0; i < m.count(); ++i) {
        const Value& d = m[i];
        if (!d.isDictionary() || d.dictionary().empty()) continue;
        const Value& sources = d["sourcePackages"];
        // A file without a source package has nothing to say about its track.
        if (sources.count() == 0) continue;
        char key[32];
        std::snprintf(key, sizeof key, "track%zu", i);
        metadata.set(key, SkarnUtilities_unpackageMetadataDictionary(sources[sources.count() - 1]));
    }
    _metadata = Value(std::move(metadata));
}

Value SkarnClip::extendedProperties() {
    Array out;
    for (const ExtendedPropertyRow& row : kExtendedProperties) {
        Dictionary d;
        d.set("identifier", Value(row.identifier));
        d.set("name", Value(localized(row.label, "")));
        if (hasSuffix(row.identifier, "Date")) {
            d.set("formatter", Value(SkarnDateFormatter::shortDateFormatter()));
            d.set("NSLineBreakMode", Value(kLineBreakByTruncatingMiddle));
        }
        out.push_back(Value(std::move(d)));
    }
    return Value(std::move(out));
}
