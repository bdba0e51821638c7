// A read-only look at a table's header for reports: the version byte, the
// lengths and the descriptors as the file has them. Bounded by the file's
// size; a damaged header yields what could be read.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

struct PeekField {
  std::string name;
  char type;
  int length;
  int decimals;
};

struct TableFacts {
  uint8_t version = 0;
  unsigned header_length = 0;
  unsigned record_length = 0;
  std::vector<PeekField> fields;
};

bool PeekTable(const std::string& path, TableFacts* facts);
