// The extension of SQLite. Compiles the same source to call the SQLite of the program that loads
// it. NOLINTNEXTLINE(bugprone-suspicious-include)
#include "platform/linux/store/blocks/MessageTables.cpp"
