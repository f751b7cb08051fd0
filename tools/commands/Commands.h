#pragma once

#include "tools/CommandSet.h"

// The groups of commands. A group defines the names, options and help of its commands, and the
// function that carries each of them out. The table in tools/CommandLine.cpp lists the groups.
namespace halvox::tools {

void addRequestCommands(CommandSet& commands);   // create, send, list…: one request each
void addScriptRequests(CommandSet& commands);    // wait, sleep: only in scripts
void addScriptCommands(CommandSet& commands);    // run, shell
void addRecordCommands(CommandSet& commands);    // events, metrics, power, link
void addExplainCommand(CommandSet& commands);    // explain
void addFieldCommand(CommandSet& commands);      // fields
void addQueryCommands(CommandSet& commands);     // sql
void addExportCommand(CommandSet& commands);     // export
void addTopCommand(CommandSet& commands);        // top
void addStatusCommand(CommandSet& commands);     // status
void addStreamCommands(CommandSet& commands);    // streams
void addReportCommand(CommandSet& commands);     // report
void addSnapshotCommands(CommandSet& commands);  // snapshots
void addSummaryCommand(CommandSet& commands);    // summary
void addVerifyCommand(CommandSet& commands);     // verify
void addStorageCommands(CommandSet& commands);   // vacuum, erase
void addTraceCommands(CommandSet& commands);     // trace
void addDriverCommand(CommandSet& commands);     // drivers
void addSettingsCommands(CommandSet& commands);  // preferences, notify

}  // namespace halvox::tools
