#include <memory>

#include "tools/Verify.h"
#include "tools/commands/Commands.h"
#include "tools/commands/Selection.h"

namespace halvox::tools {

void addVerifyCommand(CommandSet& commands) {
  const auto request = std::make_shared<VerifyStore>();
  CLI::App& verify = commands.add(
      {.name = "verify",
       .summary = "Verify that nothing in the store is damaged or missing",
       .example = "halvoxctl verify",
       .details = "Compares the database, captures and summary files with each other and prints "
                  "each difference with its place. Changes nothing; the service may run. The exit "
                  "status is 1 if there is a difference.",
       .reach = CommandReach::kFiles});
  addDatabase(verify, request->database);
  commands.onRun(
      verify, [request] { return *request; }, verifyStore);
}

}  // namespace halvox::tools
