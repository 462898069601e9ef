// The tables of the documents and those of the code say the same.
#include <gtest/gtest.h>

#include <fstream>
#include <map>
#include <sstream>

#include "protocol/QVClientProtocol.h"
#include "protocol/QVDaemonProtocol.h"
#include "protocol/QVStatusProtocol.h"
#include "protocol/RecordingErrors.h"

namespace qv {
namespace {

using Cells = std::vector<std::string>;

/// What stands before each `end`, without the spaces around it.
Cells partsOf(const std::string& text, char end) {
  Cells parts;
  std::istringstream stream(text);
  for (std::string part; std::getline(stream, part, end);) {
    const size_t first = std::min(part.find_first_not_of(' '), part.size());
    parts.push_back(part.substr(first, part.find_last_not_of(' ') + 1 - first));
  }
  return parts;
}

/// The rows of the tables below a heading.
std::vector<Cells> rowsOf(const std::string& document, const std::string& heading) {
  std::ifstream file(std::string(QV_DOCS_DIR "/") + document);
  std::vector<Cells> rows;
  bool isBelow = false;
  for (std::string line; std::getline(file, line);) {
    if (line.starts_with("## ")) isBelow = line == "## " + heading;
    if (!isBelow || !line.starts_with("| ")) continue;
    rows.push_back(partsOf(line.substr(2), '|'));
  }
  return rows;
}

/// Each operation's arguments and reply as they stand in the table; several operations may share a row.
std::map<std::string, Cells> documentedOperations(const std::string& heading) {
  std::map<std::string, Cells> operations;
  for (const Cells& cells : rowsOf("protocol.md", heading)) {
    for (const std::string& name : partsOf(cells.at(0), ',')) {
      if (!name.starts_with("`")) continue;  // the head of the table
      const std::string member = name.substr(1, name.size() - 2);
      EXPECT_TRUE(operations.emplace(member, Cells{cells.at(1), cells.at(2)}).second) << "twice: " << name;
    }
  }
  return operations;
}

std::string listOf(const std::vector<std::string>& signatures, const std::vector<std::string>& names) {
  std::string list;
  for (size_t i = 0; i < signatures.size(); ++i) {
    list += (i > 0 ? ", `" : "`") + signatures[i] + "` " + names.at(i);
  }
  return list;
}

std::string replyOf(const platform::IPCOperation& operation) {
  if (!operation.reply) return "one-way";
  return operation.reply->empty() ? "(no values)" : listOf(*operation.reply, operation.replyNames);
}

TEST(DocumentsTest, EveryOperationIsDocumentedAsItIs) {
  for (const auto& [heading, interface] :
       {std::pair("QVDaemonProtocol", daemonProtocol()), std::pair("Status", statusProtocol()),
        std::pair("QVClientProtocol", clientProtocol())}) {
    auto documented = documentedOperations(heading);
    for (const auto& operation : interface.operations) {
      const auto row = documented.extract(operation.member);
      if (!row) {
        ADD_FAILURE() << "no row for " << operation.member;
        continue;
      }
      EXPECT_EQ(row.mapped()[0], listOf(operation.arguments, operation.argumentNames)) << operation.member;
      // The client's operations have no reply, and a word there on when they come.
      const bool isDaemons = interface.name != clientProtocol().name;
      EXPECT_EQ(isDaemons ? row.mapped()[1] : "one-way", replyOf(operation)) << operation.member;
    }
    for (const auto& [member, row] : documented) ADD_FAILURE() << member << " is no operation";
  }
}

TEST(DocumentsTest, EveryErrorIsDocumentedForEitherReader) {
  const std::string prefix = "RECORDING_ERROR_";
  for (const bool isFull : {true, false}) {
    std::map<std::string, std::string> documented;
    for (const Cells& cells : isFull ? rowsOf("errors.md", "Codes") : rowsOf("app-developers.md", "9. Errors")) {
      if (cells.at(0).starts_with("-")) documented[cells[0]] = isFull ? prefix + cells.at(1) : cells.at(1);
    }
    for (const RecordingError& error : kRecordingErrors) {
      std::string key = error.key;
      if (isFull) key.insert(prefix.size(), "`").append("`");
      EXPECT_EQ(documented[std::to_string(error.code)], key);
    }
    EXPECT_EQ(documented.size(), kRecordingErrors.size());
  }
}

}  // namespace
}  // namespace qv
