#include "device_table.h"

#include <algorithm>
#include <cmath>
#include <cstddef>
#include <string>
#include <vector>

namespace appsync::host {

namespace {

using json = nlohmann::ordered_json;

// A cell as a person reads it: text as it is, "-" for nothing, yes/no, anything else as JSON.
std::string cellText(const json& value) {
  if (value.is_null()) return "-";
  if (value.is_string()) return value.get<std::string>();
  if (value.is_boolean()) return value.get<bool>() ? "yes" : "no";
  return value.dump(-1, ' ', false, json::error_handler_t::replace);
}

// Characters on the screen: UTF-8 continuation bytes take no column.
std::size_t displayWidth(const std::string& text) {
  return static_cast<std::size_t>(
      std::count_if(text.begin(), text.end(), [](char c) { return (c & 0xC0) != 0x80; }));
}

class TableText {
 public:
  explicit TableText(std::vector<std::string> headers) : rows_{std::move(headers)} {}
  void add(std::vector<std::string> row) { rows_.push_back(std::move(row)); }

  // Two spaces before each row and between columns; the last column is not padded.
  std::string render() const {
    std::vector<std::size_t> widths(rows_.front().size(), 0);
    for (const auto& row : rows_) {
      for (std::size_t i = 0; i < row.size(); ++i) {
        widths[i] = std::max(widths[i], displayWidth(row[i]));
      }
    }
    std::string out;
    for (const auto& row : rows_) {
      std::string line = " ";
      for (std::size_t i = 0; i < row.size(); ++i) {
        line += " " + row[i];
        if (i + 1 < row.size()) line += std::string(widths[i] - displayWidth(row[i]) + 1, ' ');
      }
      out += line + "\n";
    }
    return out;
  }

 private:
  std::vector<std::vector<std::string>> rows_;
};

class Sections {
 public:
  explicit Sections(bool styled) : styled_(styled) {}

  void heading(const std::string& text) {
    if (!out_.empty()) out_ += "\n";
    out_ += styled_ ? "\033[1m" + text + "\033[0m\n" : text + "\n";
  }
  void text(const std::string& text) { out_ += "  " + text + "\n"; }
  void table(const TableText& table) { out_ += table.render(); }
  // A value laid out over several lines (a property list), indented under its heading.
  void block(const json& value) {
    const std::string dumped = value.dump(2, ' ', false, json::error_handler_t::replace);
    std::size_t begin = 0;
    while (begin <= dumped.size()) {
      std::size_t end = dumped.find('\n', begin);
      if (end == std::string::npos) end = dumped.size();
      text(dumped.substr(begin, end - begin));
      begin = end + 1;
    }
  }
  const std::string& result() const { return out_; }

 private:
  bool styled_;
  std::string out_;
};

std::string counted(const std::string& title, const json& items) {
  return title + " (" + std::to_string(items.size()) + ")";
}

// A path under the device root, shown relative to it.
std::string underRoot(const json& path, const std::string& root) {
  std::string text = cellText(path);
  const std::string prefix = root.ends_with('/') ? root : root + "/";
  return text.starts_with(prefix) ? text.substr(prefix.size()) : text;
}

void registrySection(Sections& out, const json& registry, const std::string& root) {
  out.heading(counted("Registry", registry));
  if (registry.empty()) return out.text("no applications");
  TableText table({"IDENTIFIER", "KIND", "TYPE", "VERSION", "NAME", "INSTALL TYPE", "DISK USAGE",
                   "MID SINF", "BUNDLE"});
  for (const json& app : registry) {
    table.add({cellText(app.at("identifier")), cellText(app.at("kind")), cellText(app.at("type")),
               cellText(app.at("version")), cellText(app.at("name")),
               cellText(app.at("installType")), cellText(app.at("staticDiskUsage")),
               cellText(app.at("hasMIDBasedSINF")), underRoot(app.at("bundleDirectory"), root)});
  }
  out.table(table);
}

std::string placeholderText(const json& coordinator) {
  const json& placeholder = coordinator.at("placeholder");
  if (placeholder.is_null()) return "-";
  if (coordinator.at("placeholderInstalled").get<bool>()) return "installed";
  if (placeholder.at("cancelled").get<bool>()) return "cancelled";
  return placeholder.at("configurationComplete").get<bool>() ? "configured" : "configuring";
}

std::string errorText(const json& error) {
  if (error.is_null()) return "-";
  std::string text = cellText(error.at("domain")) + " " + cellText(error.at("code"));
  if (error.at("description").is_string()) text += " " + error.at("description").get<std::string>();
  return text;
}

void coordinationSection(Sections& out, const json& coordinators) {
  out.heading(counted("Coordinators", coordinators));
  if (coordinators.empty()) return out.text("no coordinators");
  TableText table({"BUNDLE", "KIND", "CREATOR", "STATE", "PLACEHOLDER", "RESPONSIBLE", "ERROR"});
  TableText promises(
      {"BUNDLE", "ROLE", "NAME", "CLIENT", "DONE", "COMPLETE", "CANCELLED", "TRANSFER PATH"});
  bool anyPromise = false;
  for (const json& c : coordinators) {
    table.add({cellText(c.at("bundleID")), cellText(c.at("kind")), cellText(c.at("creator")),
               cellText(c.at("state")), placeholderText(c), cellText(c.at("responsibleClient")),
               errorText(c.at("error"))});
    for (const json& p : c.at("promises")) {
      anyPromise = true;
      const long percent = std::lround(p.at("percentComplete").get<double>() * 100);
      promises.add({cellText(c.at("bundleID")), cellText(p.at("role")), cellText(p.at("name")),
                    cellText(p.at("client")), std::to_string(percent) + "%",
                    cellText(p.at("complete")), cellText(p.at("cancelled")),
                    cellText(p.at("transferPath"))});
    }
  }
  out.table(table);
  if (!anyPromise) return;
  out.heading("Promises");
  out.table(promises);
}

void finishedCoordinatorsSection(Sections& out, const json& finished) {
  if (finished.empty()) return;
  out.heading(counted("Finished coordinators", finished));
  TableText table({"BUNDLE", "KIND", "STATE", "ERROR", "CANCELLED BY"});
  for (const json& f : finished) {
    const std::string error = f.at("errorDomain").is_null() ? "-"
                                                            : cellText(f.at("errorDomain")) + " " +
                                                                  cellText(f.at("errorCode"));
    table.add({cellText(f.at("bundleID")), cellText(f.at("kind")), cellText(f.at("state")), error,
               cellText(f.at("cancellingClient"))});
  }
  out.table(table);
}

void todoSection(Sections& out, const json& todo) {
  const json& records = todo.at("records");
  out.heading(counted("Todo list", records));
  if (!todo.at("error").is_null()) out.text("unreadable: " + cellText(todo.at("error")));
  if (!todo.at("present").get<bool>()) {
    if (todo.at("error").is_null()) out.text("no todo list");
    return;
  }
  TableText table({"IDENTIFIER", "OPERATION", "VERSION", "NAME"});
  for (const json& r : records) {
    if (r.contains("record")) {
      table.add({"(not a record)", cellText(r.at("record")), "", ""});
      continue;
    }
    table.add({cellText(r.at("identifier")), cellText(r.at("operation")), cellText(r.at("version")),
               cellText(r.at("name"))});
  }
  out.table(table);
}

// Restore state is identifier -> version -> key -> value; anything else is shown as it is.
void restoreSection(Sections& out, const json& restore) {
  out.heading("Restore");
  out.text(std::string("restore list waiting: ") + cellText(restore.at("listWaiting")));
  const json& state = restore.at("state");
  if (!restore.at("stateError").is_null())
    out.text("state unreadable: " + cellText(restore.at("stateError")));
  if (state.is_null()) {
    if (restore.at("stateError").is_null()) out.text("no restore state");
    return;
  }
  TableText table({"IDENTIFIER", "VERSION", "KEY", "VALUE"});
  bool shaped = state.is_object();
  for (auto app = state.begin(); shaped && app != state.end(); ++app) {
    shaped = app->is_object();
    for (auto version = app->begin(); shaped && version != app->end(); ++version) {
      shaped = version->is_object();
      for (auto key = version->begin(); shaped && key != version->end(); ++key) {
        table.add({app.key(), version.key(), key.key(), cellText(*key)});
      }
    }
  }
  if (shaped) return out.table(table);
  out.text("state (not by application and version):");
  out.block(state);
}

void homeScreenSection(Sections& out, const json& home) {
  out.heading("Home screen");
  const json& state = home.at("syncNotificationState");
  out.text("sync notification " + cellText(home.at("syncNotification")) + ": " +
           (state.is_null() ? std::string("no state") : "state " + cellText(state)) + "; posts " +
           cellText(home.at("syncNotificationPosts")));
  const json& icons = home.at("iconState");
  if (icons.is_null()) return out.text("icon layout: never set");
  if (!home.at("iconStateError").is_null()) {
    out.text("icon layout (not a property list: " + cellText(home.at("iconStateError")) + "):");
  } else {
    out.text("icon layout:");
  }
  out.block(icons);
}

void installerSection(Sections& out, const json& installer, const json& restrictions) {
  out.heading("Installer and restrictions");
  const json& uninstalled = installer.at("uninstalled");
  std::string names;
  for (const json& name : uninstalled) names += (names.empty() ? "" : ", ") + cellText(name);
  out.text("uninstalled: " + (names.empty() ? std::string("none") : names));
  TableText table({"RESTRICTION", "VALUE"});
  for (auto it = restrictions.begin(); it != restrictions.end(); ++it) {
    table.add({it.key(), cellText(*it)});
  }
  out.table(table);
}

void linesSection(Sections& out, const std::string& title, const std::vector<std::string>& lines) {
  out.heading(title);
  if (lines.empty()) return out.text("nothing");
  for (const std::string& line : lines) out.text(line);
}

}  // namespace

std::string renderDeviceTable(const nlohmann::ordered_json& view, bool styled) {
  Sections out(styled);
  out.heading("Device " + cellText(view.at("root")));
  registrySection(out, view.at("registry"), cellText(view.at("root")));
  coordinationSection(out, view.at("coordinators"));
  finishedCoordinatorsSection(out, view.at("finishedCoordinators"));
  todoSection(out, view.at("todoList"));
  restoreSection(out, view.at("restore"));
  homeScreenSection(out, view.at("homeScreen"));
  installerSection(out, view.at("installer"), view.at("restrictions"));
  const json& log = view.at("log");
  linesSection(out, "Log (last lines of " + cellText(log.at("file")) + ")",
               log.at("lines").get<std::vector<std::string>>());
  std::vector<std::string> transactions;
  for (const json& entry : view.at("transactions"))
    transactions.push_back(cellText(entry.at("line")));
  linesSection(out, "Transactions (last entries)", transactions);
  return out.result();
}

}  // namespace appsync::host
