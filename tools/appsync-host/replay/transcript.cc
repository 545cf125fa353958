// Writing the transcript as JSON lines.
#include "replay/transcript.h"

#include <nlohmann/json.hpp>

#include "runtime/plist/text_encoding.h"

namespace appsync::host::replay {

namespace {

using json = nlohmann::ordered_json;

// Property lists as JSON: data as {"data": base64}, dates as {"date": ISO 8601}, archive
// references as {"uid": N}.
json plistJson(const plist::Value& value) {
  switch (value.type()) {
    case plist::Type::Boolean:
      return *value.boolean();
    case plist::Type::Integer:
      if (value.integer()->isUnsigned) return value.integer()->bits;
      return *value.int64();
    case plist::Type::Real:
      return *value.real();
    case plist::Type::String:
      return *value.string();
    case plist::Type::Data:
      return json{{"data", plist::text::base64Encode(*value.data())}};
    case plist::Type::Date: {
      auto text = plist::text::formatIsoDate(value.date()->secondsSince2001);
      return json{{"date", text ? json(*text) : json(value.date()->secondsSince2001)}};
    }
    case plist::Type::Uid:
      return json{{"uid", value.uid()->value}};
    case plist::Type::Array: {
      json array = json::array();
      for (const auto& item : *value.array()) array.push_back(plistJson(item));
      return array;
    }
    case plist::Type::Dict: {
      json object = json::object();
      for (const auto& entry : *value.dict()) object[entry.key] = plistJson(entry.value);
      return object;
    }
    case plist::Type::Null:
      return nullptr;
  }
  return nullptr;
}

void writeLine(std::ostream& out, const json& object) {
  // Messages are the client's and may hold anything: bytes that are not UTF-8 are replaced.
  out << object.dump(-1, ' ', false, json::error_handler_t::replace) << '\n';
  out.flush();
}

}  // namespace

void Transcript::step(const StepRecord& record) {
  if (quiet_ && !record.failed) return;
  json line = {{"step", record.step}, {"line", record.line}, {"action", record.action}};
  if (record.background) line["background"] = *record.background;
  if (record.result) line["result"] = plistJson(*record.result);
  json log = json::array();
  for (const auto& entry : record.produced.log) {
    log.push_back({{"category", entry.category},
                   {"level", logLevelName(entry.level)},
                   {"message", entry.message}});
  }
  line["log"] = std::move(log);
  json transactions = json::array();
  for (const auto& entry : record.produced.transactions) transactions.push_back(entry.describe());
  line["transactions"] = std::move(transactions);
  line["outcome"] = record.outcome;
  writeLine(out_, line);
}

void Transcript::summary(std::size_t steps, std::size_t failed) {
  writeLine(out_, {{"summary", {{"steps", steps}, {"failed", failed}}}});
}

}  // namespace appsync::host::replay
