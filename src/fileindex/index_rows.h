// A listing of documents as the engine answers it, read without making a value of each: an index of a million files has
// five million of them.
#pragma once

#include <cstdint>
#include <functional>
#include <string>

namespace quarrox::fileindex {

// What a comparison asks for by default. -1 where a number is missing.
struct ListedDocument {
  std::string path;
  int64_t size = -1;
  int64_t changed = -1;  // seconds since the epoch, as the next
  int64_t attributes_changed = -1;
  bool is_directory = false;
};

// Hands out the documents of a response and how many elements its list has. False where the response is no plain one
// of success; some may have been handed out by then.
bool ReadListing(const std::string& response, const std::function<void(ListedDocument&&)>& take, size_t& elements);

}  // namespace quarrox::fileindex
