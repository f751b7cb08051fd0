#pragma once

#include "tools/CommandSet.h"

// The groups of commands. A group owns the names, options and help of its commands and says which
// function carries each of them out; the table in tools/CommandLine.cpp puts the groups together.
namespace halvox::tools {

void addRequestCommands(CommandSet& commands);   // create, send, list…: a request each
void addScriptRequests(CommandSet& commands);    // wait, sleep: in scripts only
void addScriptCommands(CommandSet& commands);    // run, shell
void addRecordCommands(CommandSet& commands);    // events, metrics, power, link
void addSnapshotCommands(CommandSet& commands);  // snapshots
void addSummaryCommand(CommandSet& commands);    // summary
void addTraceCommands(CommandSet& commands);     // trace
void addDriverCommand(CommandSet& commands);     // drivers
void addSettingsCommands(CommandSet& commands);  // preferences, notify

}  // namespace halvox::tools
