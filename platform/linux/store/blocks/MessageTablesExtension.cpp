// The extension of SQLite: the same source, compiled to call the SQLite of the program that loads
// it. NOLINTNEXTLINE(bugprone-suspicious-include)
#include "platform/linux/store/blocks/MessageTables.cpp"
