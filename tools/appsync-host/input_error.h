// Bad input to appsync-host: which file, which line, which field, and what is wrong with it.
// Commands print it on stderr and exit with status 2.
#pragma once

#include <stdexcept>
#include <string>

namespace appsync::host {

inline constexpr int kExitDone = 0;
inline constexpr int kExitFailed = 1;
inline constexpr int kExitBadInput = 2;

class InputError : public std::runtime_error {
 public:
  // `line` 0: the error is about the file as a whole. `field` may be empty.
  InputError(std::string file, int line, std::string field, const std::string& message)
      : std::runtime_error(format(file, line, field, message)),
        file_(std::move(file)),
        line_(line),
        field_(std::move(field)) {}

  const std::string& file() const { return file_; }
  int line() const { return line_; }
  const std::string& field() const { return field_; }

 private:
  // "FILE:LINE: FIELD: message"
  static std::string format(const std::string& file, int line, const std::string& field,
                            const std::string& message) {
    std::string text = file;
    if (line > 0) text += ":" + std::to_string(line);
    text += ": ";
    if (!field.empty()) text += field + ": ";
    return text + message;
  }

  std::string file_;
  int line_;
  std::string field_;
};

}  // namespace appsync::host
