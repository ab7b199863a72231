// English sentences for the engine's outcomes: every result code and every message key
// of the desktop's text tables that the engine hands out, each with what to do about it.
// The engine itself only gives codes and keys; the programs that talk to people (the
// command line, the Package Center) turn them into words here, so they say the same.
#pragma once

#include <json/json.h>

#include <map>
#include <string>
#include <vector>

namespace corvtext {

// Who reads the remedy: the command line names its options and commands, the desktop
// names what its pages offer.
enum class Audience { CommandLine, Desktop };

struct Text {
    std::string sentence;  // what happened, one sentence ending in a full stop
    std::string remedy;    // what to do about it; empty when there is nothing to do
};

// Named values that fill a text. Known names: "package", "operation" (install, upgrade,
// repair, uninstall, start, stop, restart, check), "deppkg", "oldver", "curver", "port",
// "names", "services", "volume", "needed", "free", "file", "osver", "product", "holder".
// A text's optional part that needs a missing or empty value is left out, so any subset
// gives a whole sentence.
using Params = std::map<std::string, std::string>;

// The text of a result code (PKG_ERRCODE). A code outside the known list gets a generic
// sentence that names its number.
Text textForCode(int code, const Params& params = {}, Audience audience = Audience::CommandLine);

// The text of a message key "section:key" with its arguments (the elements that follow the
// key in an error array). They fill the key's placeholders 1, 2, ... An unknown key gets a
// generic sentence that names it.
Text textForKey(const std::string& key, const std::vector<std::string>& args = {},
                const Params& params = {}, Audience audience = Audience::CommandLine);

// An error array as the engine and its tasks give it: first the key, then its arguments.
// An empty or malformed array gives an empty text.
Text textForMessage(const Json::Value& array, const Params& params = {},
                    Audience audience = Audience::CommandLine);

// Whether the key has a text of its own (not the generic one).
bool hasTextForKey(const std::string& key);
// Whether the code has a text of its own.
bool hasTextForCode(int code);

// "sentence remedy" as one line; just the sentence when there is no remedy.
std::string oneLine(const Text& text);

}  // namespace corvtext
