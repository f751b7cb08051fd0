#include "tools/Sql.h"

#include <cerrno>
#include <cstdio>
#include <iterator>
#include <memory>
#include <string_view>
#include <type_traits>
#include <vector>

#include "platform/linux/base/ErrnoText.h"
#include "platform/linux/store/reading/StoreQueries.h"
#include "tools/Complaint.h"
#include "tools/JsonText.h"
#include "tools/StoreRun.h"

namespace halvox::tools {
namespace {

using platform::linux_::StoreQueries;
using Value = StoreQueries::Value;

// The text of the rows of one statement. It is in a file without a name, because a result may be
// larger than memory.
class Spool {
 public:
  Spool() : file_(std::tmpfile(), std::fclose) { isGood_ = file_ != nullptr; }
  void add(std::string_view text) {
    if (isGood_) isGood_ = std::fwrite(text.data(), 1, text.size(), file_.get()) == text.size();
  }
  // Copies everything to `out`. Returns false if the file could not be written or read; errno says
  // why.
  bool copyTo(std::ostream& out) {
    if (!isGood_ || std::fflush(file_.get()) != 0) return false;
    std::rewind(file_.get());
    std::vector<char> piece(std::size_t{64} * 1024);
    while (const std::size_t length = std::fread(piece.data(), 1, piece.size(), file_.get())) {
      out.write(piece.data(), static_cast<std::streamsize>(length));
    }
    return std::ferror(file_.get()) == 0;
  }

 private:
  std::unique_ptr<std::FILE, int (*)(std::FILE*)> file_;
  bool isGood_ = false;
};

std::string hexadecimal(std::span<const std::byte> bytes) {
  constexpr std::string_view kDigits = "0123456789abcdef";
  std::string text;
  for (const std::byte byte : bytes) {
    text += kDigits[std::to_integer<std::size_t>(byte >> 4U)];
    text += kDigits[std::to_integer<std::size_t>(byte & std::byte{15})];
  }
  return text;
}

std::string textOf(const Value& value, OutputForm form) {
  const bool isJson = form == OutputForm::kJson;
  return std::visit(
      [&](const auto& content) -> std::string {
        using Content = std::decay_t<decltype(content)>;
        if constexpr (std::is_same_v<Content, std::monostate>) {
          return isJson ? "null" : "";
        } else if constexpr (std::is_same_v<Content, std::int64_t>) {
          return std::to_string(content);
        } else if constexpr (std::is_same_v<Content, double>) {
          return isJson ? toJson(content) : shortNumber(content);
        } else if constexpr (std::is_same_v<Content, std::string_view>) {
          // Clients choose the texts. Escape sequences in them must not reach the terminal.
          return isJson ? harmlessJson(tools::quoted(content)) : harmlessText(content);
        } else {
          return isJson ? tools::quoted(hexadecimal(content)) : hexadecimal(content);
        }
      },
      value);
}

class Shell {
 public:
  Shell(const RunSql& request, OutputForm form, const ToolStreams& streams)
      : request_(request),
        form_(form),
        streams_(streams),
        complain_("sql", form, streams.output, streams.errors) {}

  ExitStatus run() {
    const auto directory = storeDirectory(request_.database, complain_);
    if (const auto* status = std::get_if<ExitStatus>(&directory)) return *status;
    if (const auto opened = queries_.open(std::get<std::filesystem::path>(directory)); !opened) {
      return complain_(ExitStatus::kNoService, opened.error().message, "no-store");
    }
    if (!request_.query.empty()) return runAll(request_.query);
    if (streams_.isInputTerminal) return ask();
    return runAll({std::istreambuf_iterator<char>(streams_.input), {}});
  }

 private:
  ExitStatus ask() {
    std::string sql;
    std::string line;
    while (prompt(sql) && std::getline(streams_.input, line)) {
      if (sql.empty() && (line == "exit" || line == "quit")) return ExitStatus::kDone;
      sql += line + '\n';
      if (!StoreQueries::isComplete(sql)) continue;
      static_cast<void>(runAll(sql));
      sql.clear();
    }
    streams_.errors << '\n';
    return ExitStatus::kDone;
  }
  bool prompt(const std::string& begun) {
    streams_.output << std::flush;
    streams_.errors << (begun.empty() ? "halvox> " : "   ...> ") << std::flush;
    return true;
  }

  ExitStatus runAll(const std::string& text) {
    for (std::string_view sql = text; !sql.empty() && streams_.output;) {
      const ExitStatus status = runFirst(sql);
      if (status != ExitStatus::kDone) return status;
    }
    return ExitStatus::kDone;
  }

  ExitStatus runFirst(std::string_view& sql) {
    Spool spool;
    std::vector<std::string> names;
    const auto ran = queries_.runFirst(
        sql,
        [&](const std::vector<std::string>& columns) {
          names = columns;
          if (form_ == OutputForm::kText) spool.add(header(names));
        },
        [&](const std::vector<Value>& values) { spool.add(row(names, values)); });
    // The rows before an error are printed too.
    if (!spool.copyTo(streams_.output)) {
      return complain_(ExitStatus::kCannotWrite, "cannot keep the rows in a temporary file: " +
                                                     platform::linux_::errnoText(errno));
    }
    streams_.output << std::flush;
    if (!ran) return complain_(ExitStatus::kBadArguments, ran.error().message);
    return ExitStatus::kDone;
  }

  static std::string header(const std::vector<std::string>& names) {
    std::string line;
    for (const std::string& name : names) {
      if (!line.empty()) line += '\t';
      line += harmlessText(name);
    }
    return line + '\n';
  }
  [[nodiscard]] std::string row(const std::vector<std::string>& names,
                                const std::vector<Value>& values) const {
    const bool isJson = form_ == OutputForm::kJson;
    std::string line = isJson ? "{" : "";
    for (std::size_t column = 0; column < values.size(); ++column) {
      if (column > 0) line += isJson ? ',' : '\t';
      if (isJson) line += harmlessJson(tools::quoted(names[column])) + ':';
      line += textOf(values[column], form_);
    }
    return line + (isJson ? "}\n" : "\n");
  }

  const RunSql& request_;
  const OutputForm form_;
  const ToolStreams& streams_;
  const Complaint complain_;
  StoreQueries queries_;
};

}  // namespace

ExitStatus runSql(const RunSql& request, const CommonOptions& options, const ToolStreams& streams) {
  return Shell(request, options.form(), streams).run();
}

}  // namespace halvox::tools
