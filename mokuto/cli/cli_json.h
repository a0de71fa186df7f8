#pragma once
// The JSON form of a job that the commands print: its speech text, the bookmark numbers
// in use, the inputMode2 flag and its actions with the fields of their records.
#include <nlohmann/json.hpp>
#include <string>

#include "mokuto/mktaskinstruction.h"

namespace mokuto::cli {

using Json = nlohmann::ordered_json;

Json jobToJson(const ZU::MKTaskInstruction& job);
// Indented by two, invalid UTF-8 replaced.
std::string dumpJson(const Json& json);

}  // namespace mokuto::cli
