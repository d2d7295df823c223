#pragma once

#include <cstddef>
#include <string>

#include "platform/PropertyPort.h"

// Every property the service reads, the television's and the host's, in one table: its key,
// how its text becomes a value, what an unset key means, what is accepted, who reads it and
// when a change takes effect. The service reads the start-time ones once into
// config::Settings, and the few that act at the next PLAY again through their entry here. Only
// the host platform, a layer below this one, reads its own (orvex.host.*, and kv.orvex.log for
// its log level) itself, with the texts and defaults its entries name. The host's misspelt-key
// warning (through cmake/PropertyKeys.cmake) and tools/check-properties.py take their list of
// keys from this table.
// Thread contract: the table is constant; the functions may run on any thread.

namespace config {

// Indexes of the table, in its order (the keys' alphabetical order).
enum class Property {
    kFlavour,
    kAacEncoder,
    kAllow,
    kAudioClock,
    kAudioPayloadType,
    kAuth,
    kBind,
    kDumpToSd,
    kHttp,
    kHttpMax,
    kJoin,
    kLatency,
    kLog,
    kPublish,
    kSdp,
    kWake,
    kWebRtc,
    kHostAudio,
    kHostLog,
    kHostLogLevel,
    kHostVideo,
    kHostVideoSub,
    kBoard,
    kCount,
};

enum class PropertyType {
    kText,       // the text as the port copies it: at most kPropertyValueMax - 1 bytes
    kWholeText,  // the whole text (PropertyPort::Lookup): host capture pipelines are longer
    kSwitch,     // `on` is 1; unset or `off` 0; anything else 0, refused
    kNumber,     // a decimal integer (strtol) from `min` to `max`; anything else `fallback`
    kNonZero,    // atoi(text) != 0, as the television's debug switches are read; never refused
    kChoice,     // 1 + the index of the text among `choices`, exactly; anything else 0
    kAddress,    // unset, or a dotted IPv4 address; anything else refused
};

enum class TakesEffect {
    kAtStart,     // read once into config::Settings
    kAtPlay,      // read again at every capture choice, DESCRIBE or send thread start
    kAtFirstUse,  // read at first use, and again while it names nothing known
};

// The log priority meaning "OrvexLog": the service's own trace (debug, and its stdout copy).
constexpr int kTraceLine = -1;

struct PropertyDef {
    Property id;
    const char* key;
    PropertyType type;
    const char* unset;           // the text an unset or empty key reads as
    const char* off;             // kSwitch: the other accepted word (null: any other text is off)
    const char* on;              // kSwitch: the word that turns it on
    long min, max, fallback;     // kNumber
    const char* const* choices;  // kChoice: null-terminated
    TakesEffect takes;
    const char* reader;  // who reads it, for people
    // How a refused value is logged: tag, priority (kTraceLine: OrvexLog), and the line, a
    // printf format whose one %s is the text as read. Null: refused silently.
    const char* tag;
    int priority;
    const char* refusal;
};

// A property's value as its entry reads it.
struct PropertyValue {
    std::string text;  // as read, the entry's `unset` text when the key is unset or empty
    long number = 0;   // kSwitch, kNonZero: 0 or 1; kNumber: the number; kChoice: the index
    bool refused = false;
    std::string refusal;  // the log line for a refused value; empty when there is none
};

const PropertyDef& Def(Property id);
// The whole table, in key order.
const PropertyDef* Defs();
constexpr size_t kPropertyCount = static_cast<size_t>(Property::kCount);
// The entry of `key`, null when no part of the service reads it.
const PropertyDef* FindDef(const std::string& key);

// Pure: the value of `text`, what the port gave for the key (the unset text already applied).
PropertyValue ParseProperty(const PropertyDef& def, const std::string& text);
// Reads `def`'s key from `port` and parses it. Logs nothing: the caller logs `refusal`.
PropertyValue ReadProperty(platform::PropertyPort& port, const PropertyDef& def);

}  // namespace config
