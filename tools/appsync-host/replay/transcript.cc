// Writing the transcript as JSON lines.
#include "replay/transcript.h"

#include <nlohmann/json.hpp>

#include "plist_json.h"

namespace appsync::host::replay {

namespace {

using json = nlohmann::ordered_json;

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
  if (record.result) line["result"] = plistToJson(*record.result);
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
