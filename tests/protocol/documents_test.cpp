// The tables of the documents and those of the code say the same.
#include <gtest/gtest.h>

#include <fstream>
#include <map>
#include <regex>

#include "protocol/QVClientProtocol.h"
#include "protocol/QVDaemonProtocol.h"
#include "protocol/RecordingErrors.h"

namespace qv {
namespace {

using Cells = std::vector<std::string>;

/// The rows of the tables below a heading.
std::vector<Cells> rowsOf(const std::string& document, const std::string& heading) {
  std::ifstream file(std::string(QV_DOCS_DIR "/") + document);
  std::vector<Cells> rows;
  bool isBelow = false;
  for (std::string line; std::getline(file, line);) {
    if (line.starts_with("## ")) isBelow = line == "## " + heading;
    if (!isBelow || !line.starts_with("| ")) continue;
    static const std::regex kCell(R"(\| *([^|]*[^| ])? *(?=\|))");
    Cells& cells = rows.emplace_back();
    for (std::sregex_iterator cell(line.begin(), line.end(), kCell), end; cell != end; ++cell) {
      cells.push_back((*cell)[1]);
    }
  }
  return rows;
}

/// Each operation's arguments and reply as they stand in the table; several operations may share a row.
std::map<std::string, Cells> documentedOperations(const std::string& heading) {
  std::map<std::string, Cells> operations;
  for (const Cells& cells : rowsOf("protocol.md", heading)) {
    static const std::regex kName("`(\\w+)`");
    const std::string& names = cells.at(0);
    for (std::sregex_iterator name(names.begin(), names.end(), kName), end; name != end; ++name) {
      EXPECT_TRUE(operations.emplace((*name)[1], Cells{cells.at(1), cells.at(2)}).second) << "twice: " << (*name)[1];
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

TEST(DocumentsTest, EveryRequestIsDocumentedAsItIs) {
  std::map<std::string, Cells> operations;
  for (const auto& operation : daemonProtocol().operations) {
    std::string reply = "one-way";
    if (operation.reply)
      reply = operation.reply->empty() ? "(no values)" : listOf(*operation.reply, operation.replyNames);
    operations[operation.member] = {listOf(operation.arguments, operation.argumentNames), reply};
  }
  EXPECT_EQ(documentedOperations("QVDaemonProtocol"), operations);
}

TEST(DocumentsTest, EveryCallbackIsDocumentedAsItIs) {
  auto documented = documentedOperations("QVClientProtocol");
  for (const auto& operation : clientProtocol().operations) {
    const auto row = documented.extract(operation.member);
    ASSERT_TRUE(row) << operation.member;
    EXPECT_EQ(row.mapped()[0], listOf(operation.arguments, operation.argumentNames)) << operation.member;
    EXPECT_FALSE(operation.reply) << operation.member;
  }
  EXPECT_TRUE(documented.empty()) << documented.begin()->first;
}

TEST(DocumentsTest, EveryErrorIsDocumentedForEitherReader) {
  const std::string prefix = "RECORDING_ERROR_";
  std::vector<Cells> full, short_;
  for (const RecordingError& error : kRecordingErrors) {
    const std::string code = std::to_string(error.code), key = error.key;
    full.push_back({code, key});
    short_.push_back({code, "`" + key.substr(prefix.size()) + "`"});
  }
  const auto documented = [](const std::string& document, const std::string& heading) {
    std::vector<Cells> errors;
    for (const Cells& cells : rowsOf(document, heading)) {
      if (cells.at(0).starts_with("-")) errors.push_back({cells[0], cells.at(1)});
    }
    return errors;
  };
  EXPECT_EQ(documented("errors.md", "Codes"), short_);
  EXPECT_EQ(documented("app-developers.md", "9. Errors"), full);
}

}  // namespace
}  // namespace qv
