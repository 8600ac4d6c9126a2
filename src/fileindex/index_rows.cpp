#include "fileindex/index_rows.h"

#include <string_view>
#include <utility>

#ifdef __SSE2__
#define RAPIDJSON_SSE2
#endif
#include <rapidjson/memorystream.h>
#include <rapidjson/reader.h>

namespace quarrox::fileindex {
namespace {

// Takes {"success":true,"data":[{...}, ...],"total":N}, and in the elements nothing that is no plain value. What it
// refuses ends the parser.
class Handler {
 public:
  explicit Handler(const std::function<void(ListedDocument&&)>& take) : take_(take) {}

  bool is_success() const { return success_ && listed_; }
  size_t elements() const { return elements_; }

  bool StartObject() {
    ++depth_;
    document_ = {};
    return depth_ == 1 || depth_ == kElement;
  }
  bool EndObject(unsigned int) {
    if (depth_-- != kElement) return true;
    ++elements_;
    if (!document_.path.empty()) take_(std::move(document_));
    return true;
  }
  bool StartArray() {
    const bool is_first = !std::exchange(listed_, true);
    return ++depth_ == kElement - 1 && member_ == Member::kData && is_first;
  }
  bool EndArray(unsigned int) {
    --depth_;
    return true;
  }
  bool Key(const char* text, unsigned int size, bool) {
    member_ = MemberOf(std::string_view(text, size));
    return true;
  }
  bool String(const char* text, unsigned int size, bool) {
    if (depth_ == kElement && member_ == Member::kPath) document_.path.assign(text, size);
    return depth_ == kElement;
  }
  bool Bool(bool value) {
    if (depth_ == 1 && member_ == Member::kSuccess) success_ = value;
    if (depth_ == kElement && member_ == Member::kIsDirectory) document_.is_directory = value;
    return depth_ == 1 ? member_ == Member::kSuccess : depth_ == kElement;
  }
  bool Null() { return depth_ == kElement; }
  bool Int(int value) { return Int64(value); }
  bool Uint(unsigned int value) { return Int64(value); }
  bool Uint64(uint64_t value) { return Int64(static_cast<int64_t>(value)); }
  bool Double(double) { return false; }
  bool RawNumber(const char*, unsigned int, bool) { return false; }
  bool Int64(int64_t value) {
    if (depth_ == 1) return true;  // how many there are in all
    switch (member_) {
      case Member::kSize:
        document_.size = value;
        break;
      case Member::kChanged:
        document_.changed = value;
        break;
      case Member::kAttributesChanged:
        document_.attributes_changed = value;
        break;
      case Member::kIsDirectory:
        document_.is_directory = value != 0;
        break;
      default:
        break;
    }
    return depth_ == kElement;
  }

 private:
  enum class Member { kOther, kSuccess, kData, kPath, kSize, kChanged, kAttributesChanged, kIsDirectory };

  // Where the values of an element stand: in an object in an array in an object.
  static constexpr int kElement = 3;

  static Member MemberOf(std::string_view name) {
    constexpr std::pair<std::string_view, Member> kMembers[] = {
        {"VEXOMDPath", Member::kPath},
        {"VEXOMDFSSize", Member::kSize},
        {"VEXOMDFSContentChangeDate", Member::kChanged},
        {"VEXOMDAttributeChangeDate", Member::kAttributesChanged},
        {"VEXOMDIsDir", Member::kIsDirectory},
        {"success", Member::kSuccess},
        {"data", Member::kData},
    };
    for (const auto& [text, member] : kMembers) {
      if (name == text) return member;
    }
    return Member::kOther;
  }

  const std::function<void(ListedDocument&&)>& take_;
  ListedDocument document_;
  size_t elements_ = 0;
  int depth_ = 0;
  Member member_ = Member::kOther;
  bool success_ = false;
  bool listed_ = false;
};

}  // namespace

bool ReadListing(const std::string& response, const std::function<void(ListedDocument&&)>& take, size_t& elements) {
  rapidjson::MemoryStream stream(response.data(), response.size());
  Handler handler(take);
  rapidjson::Reader reader;
  if (reader.Parse(stream, handler).IsError() || !handler.is_success()) return false;
  elements = handler.elements();
  return true;
}

}  // namespace quarrox::fileindex
