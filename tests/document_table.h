// Tables of the documents, as the tables of the code make them.
#pragma once

#include <gtest/gtest.h>

#include <string>

#include "base/files/file.h"

namespace tally {

// A table that differs is shown whole, to be copied into the document.
inline void expectInDocument(const char* name, const std::string& table) {
  const auto text = readFile(std::string(DOCUMENTS "/") + name, 1 << 20);
  ASSERT_TRUE(text) << text.error().message;
  EXPECT_TRUE(text->find("\n\n" + table + "\n") != std::string::npos)
      << name << " lacks this table:\n"
      << table;
}

}  // namespace tally
