#include "tools/Summary.h"

#include <algorithm>
#include <array>
#include <cstdio>
#include <filesystem>
#include <optional>
#include <string>
#include <utility>
#include <variant>
#include <vector>

#include "tools/JsonText.h"
#include "tools/ServiceConfiguration.h"
#include "tools/SummaryReader.h"
#include "tools/TextTable.h"

namespace halvox::tools {
namespace {

namespace fs = std::filesystem;

struct Session {
  std::string file;
  SummaryName name;  // empty texts when the file has another name
  SummaryTotals totals;
};

std::string secondsText(double seconds) {
  std::array<char, 64> text{};
  std::snprintf(text.data(), text.size(), "%.3f", seconds);
  return text.data();
}

std::vector<std::string> rowOf(const Session& session) {
  const auto orDash = [](const std::string& text) {
    return text.empty() ? std::string("-") : harmlessText(text);
  };
  const SummaryTotals& totals = session.totals;
  return {orDash(session.name.time),
          orDash(session.name.application),
          orDash(session.name.service),
          std::to_string(totals.messages),
          totals.seconds ? secondsText(*totals.seconds) : "-",
          totals.volumeIntervals > 0 ? std::to_string(totals.volumeIntervals) : "-"};
}

void printTable(const std::vector<Session>& sessions, std::ostream& out) {
  TextTable table({{.heading = "TIME"},
                   {.heading = "APPLICATION"},
                   {.heading = "SERVICE"},
                   {.heading = "MESSAGES"},
                   {.heading = "SECONDS"},
                   {.heading = "VOLUMES"}});
  for (const Session& session : sessions) table.add(rowOf(session));
  table.print(out, std::nullopt);
}

std::string jsonOf(const Session& session) {
  const auto text = [](std::string_view value) { return harmlessJson(quoted(value)); };
  std::string json = "{\"file\":" + text(session.file) + ",\"time\":" + text(session.name.time) +
                     ",\"application\":" + text(session.name.application) +
                     ",\"service\":" + text(session.name.service) +
                     ",\"messages\":" + std::to_string(session.totals.messages);
  if (session.totals.seconds) json += ",\"seconds\":" + secondsText(*session.totals.seconds);
  return json + ",\"volume_intervals\":" + std::to_string(session.totals.volumeIntervals) + "}";
}

void printMessage(std::string_view identifier, std::string_view message, OutputForm form,
                  std::ostream& out) {
  if (form == OutputForm::kText) {
    out << harmlessText(identifier) << "  " << fieldsOfJson(message) << '\n';
  } else {
    out << "{\"identifier\":" << harmlessJson(quoted(identifier))
        << ",\"message\":" << harmlessJson(message) << "}\n";
  }
}

bool read(const std::string& file, const SummaryMessageHandler& handler, Session& session,
          const Complaint& complain) {
  session.file = file;
  session.name = parseSummaryName(fs::path(file).filename().string()).value_or(SummaryName{});
  const auto totals = readSummary(file, handler);
  if (totals) {
    session.totals = *totals;
  } else {
    complain(ExitStatus::kBadArguments, file + ": " + totals.error().message);
  }
  return totals.has_value();
}

// Reads the file twice, because the table comes before the messages and needs all of them.
ExitStatus showOne(const std::string& file, OutputForm form, std::ostream& out,
                   const Complaint& complain) {
  Session session;
  if (!read(file, nullptr, session, complain)) return ExitStatus::kBadArguments;
  if (form == OutputForm::kText) {
    printTable({session}, out);
    out << '\n';
  } else {
    out << jsonOf(session) << '\n';
  }
  Session again;
  const auto print = [&](std::string_view identifier, std::string_view message) {
    printMessage(identifier, message, form, out);
  };
  return read(file, print, again, complain) ? ExitStatus::kDone : ExitStatus::kBadArguments;
}

// Broken files are reported, and the others are still shown.
ExitStatus showTable(const std::vector<std::string>& files, OutputForm form, std::ostream& out,
                     const Complaint& complain) {
  std::vector<Session> sessions;
  for (const std::string& file : files) {
    Session session;
    if (read(file, nullptr, session, complain)) sessions.push_back(std::move(session));
  }
  if (form == OutputForm::kJson) {
    for (const Session& session : sessions) out << jsonOf(session) << '\n';
  } else if (!sessions.empty()) {
    printTable(sessions, out);
  }
  return sessions.size() == files.size() ? ExitStatus::kDone : ExitStatus::kBadArguments;
}

// Returns the newest summaries of the directory by the time in their names, newest last.
std::vector<std::string> newestIn(const fs::path& directory, std::uint64_t count,
                                  std::error_code& error) {
  std::vector<std::pair<std::int64_t, std::string>> found;
  for (fs::directory_iterator entry(directory, error), end; !error && entry != end;
       entry.increment(error)) {
    const auto name = parseSummaryName(entry->path().filename().string());
    if (name) found.emplace_back(name->secondsSince1970, entry->path().string());
  }
  std::ranges::sort(found);
  // Sorted by the time in the name, not by the time of the file, because a copy has another file
  // time.
  if (found.size() > count) found.erase(found.begin(), found.end() - static_cast<long>(count));
  std::vector<std::string> files;
  files.reserve(found.size());
  for (auto& [time, file] : found) files.push_back(std::move(file));
  return files;
}

ExitStatus showNewest(std::uint64_t count, OutputForm form, std::ostream& out,
                      const Complaint& complain) {
  const auto configuration = serviceConfiguration(complain);
  if (const auto* status = std::get_if<ExitStatus>(&configuration)) return *status;
  const fs::path directory =
      std::get<platform::linux_::Configuration>(configuration).storage.root / kSummaryDirectory;
  std::error_code error;
  const auto files = newestIn(directory, count, error);
  if (error || (files.empty() && count > 0)) {
    return complain(ExitStatus::kNoService,
                    directory.string() + ": " + (error ? error.message() : "has no summaries") +
                        "; the service writes them on internal builds only",
                    "no-store");
  }
  return showTable(files, form, out, complain);
}

}  // namespace

ExitStatus showSummaries(const ShowSummaries& request, OutputForm form, std::ostream& out,
                         std::ostream& errors) {
  const Complaint complain("summary", form, out, errors);
  if (request.files.empty()) return showNewest(request.last, form, out, complain);
  if (request.files.size() == 1) return showOne(request.files.front(), form, out, complain);
  return showTable(request.files, form, out, complain);
}

}  // namespace halvox::tools
