#include "platform/value/PlistGuard.h"

#include <plist/plist.h>

#include <algorithm>
#include <cerrno>
#include <optional>
#include <string_view>
#include <vector>

#include "platform/os/Format.h"

namespace value {

namespace {

os::Error invalid(std::string message) {
  return os::Error{EINVAL, std::move(message)};
}

// A binary property list ("bplist00") located through its 32-byte trailer: an offset table
// gives each object's position; containers hold references (object numbers) to their elements.
struct Binary {
  struct Object {
    bool container = false;
    std::size_t firstRef = 0;
    std::uint64_t refs = 0;
    std::uint64_t keys = 0;  // A dictionary's first |keys| references are its keys.
  };
  struct Sized {
    int type;
    std::size_t at;  // The first byte after the marker and its count.
    std::uint64_t count;
  };

  std::span<const std::uint8_t> bytes;
  std::size_t offsetSize, refSize;
  std::uint64_t count, top, table;

  std::uint64_t number(std::size_t at, std::size_t size) const {
    std::uint64_t n = 0;
    for (std::size_t i = 0; i < size; ++i) n = (n << 8) | bytes[at + i];
    return n;
  }

  // The object number that container |object| refers to in place |i|.
  std::uint64_t reference(const Object& object, std::uint64_t i) const {
    return number(object.firstRef + i * refSize, refSize);
  }

  // Where object |index| starts, and the item count its marker gives (the count of a string,
  // array or dictionary); nothing when its bytes lie outside the object area.
  std::optional<Sized> sized(std::uint64_t index) const {
    std::uint64_t offset = number(table + index * offsetSize, offsetSize);
    if (offset < 8 || offset >= table) return std::nullopt;
    std::uint8_t marker = bytes[offset];
    std::size_t at = offset + 1;
    std::uint64_t n = marker & 0xF;
    if (n == 0xF) {  // The count follows as an integer object of 1, 2, 4 or 8 bytes.
      if (at >= table || bytes[at] >> 4 != 1 || (bytes[at] & 0xF) > 3) return std::nullopt;
      std::size_t width = std::size_t{1} << (bytes[at] & 0xF);
      if (at + 1 + width > table) return std::nullopt;
      n = number(at + 1, width);
      at += 1 + width;
    }
    return Sized{marker >> 4, at, n};
  }

  // The references of object |index|; nothing when its bytes lie outside the object area.
  std::optional<Object> object(std::uint64_t index) const {
    auto item = sized(index);
    if (!item) return std::nullopt;
    if (item->type != 0xA && item->type != 0xC && item->type != 0xD) return Object{};
    std::uint64_t perEntry = item->type == 0xD ? 2 : 1;  // A dictionary: its keys, its values.
    if (item->count > (table - item->at) / refSize / perEntry) return std::nullopt;
    return Object{true, item->at, item->count * perEntry, item->type == 0xD ? item->count : 0};
  }

  // Whether object |index| is a string without NUL. libplist asserts that a key's length
  // matches strlen() when the key is read back, so a NUL inside a key would end the process.
  bool isKey(std::uint64_t index) const {
    if (index >= count) return false;
    auto key = sized(index);
    if (!key || (key->type != 0x5 && key->type != 0x6)) return false;
    std::size_t unit = key->type == 0x6 ? 2 : 1;  // ASCII bytes or UTF-16 code units.
    if (key->count > (table - key->at) / unit) return false;
    for (std::uint64_t i = 0; i < key->count; ++i) {
      if (number(key->at + i * unit, unit) == 0) return false;
    }
    return true;
  }

  // Whether every key of dictionary |object| is a string without NUL. |known| marks the objects
  // found to be keys so far, so that a long key shared by many entries is read once.
  bool keysValid(const Object& object, std::vector<bool>& known) const {
    for (std::uint64_t i = 0; i < object.keys; ++i) {
      std::uint64_t key = reference(object, i);
      if (key < count && known[key]) continue;
      if (!isKey(key)) return false;
      known[key] = true;
    }
    return true;
  }
};

std::optional<Binary> locate(std::span<const std::uint8_t> bytes) {
  constexpr std::size_t kTrailer = 32;
  if (bytes.size() < 8 + kTrailer) return std::nullopt;
  std::size_t end = bytes.size() - kTrailer;
  Binary b{bytes, bytes[end + 6], bytes[end + 7], 0, 0, 0};
  b.count = b.number(end + 8, 8);
  b.top = b.number(end + 16, 8);
  b.table = b.number(end + 24, 8);
  bool sizesOk = b.offsetSize >= 1 && b.offsetSize <= 8 && b.refSize >= 1 && b.refSize <= 8;
  if (!sizesOk || b.table < 8 || b.table > end || b.top >= b.count) return std::nullopt;
  if (b.count > (end - b.table) / b.offsetSize) return std::nullopt;
  return b;
}

// A container being measured: its references, the next one to follow, and what its finished
// elements added up to so far.
struct Visit {
  std::uint64_t index;
  Binary::Object object;
  std::uint64_t next = 0;
  std::uint64_t nodes = 1;
  std::size_t depth = 0;
};

// Scans XML markup for the nesting of <array> and <dict>. Inside comments, CDATA, processing
// instructions and declarations the markup still counts, but cannot take the depth below where
// the region began: that bound holds whether or not libplist skips such a region.
class XmlScan {
 public:
  XmlScan(std::string_view text, std::size_t maxDepth) : text_(text), maxDepth_(maxDepth) {}

  // The nesting depth reached, stopping early once it passes the limit; and the element count.
  std::size_t deepest() const { return deepest_; }
  std::size_t elements() const { return elements_; }

  void run() {
    std::size_t at = 0;
    while (deepest_ <= maxDepth_ && (at = text_.find('<', at)) != std::string_view::npos) {
      at = step(at);
    }
  }

 private:
  static constexpr std::string_view kRegions[][2] = {
      {"<!--", "-->"}, {"<![CDATA[", "]]>"}, {"<?", "?>"}, {"<!", ">"}};

  std::size_t step(std::size_t at) {
    std::string_view rest = text_.substr(at);
    for (const auto& [open, close] : kRegions) {
      if (!rest.starts_with(open)) continue;
      std::size_t end = std::min(text_.find(close, at + open.size()), text_.size());
      region(text_.substr(at + open.size(), end - at - open.size()));
      return end;
    }
    std::size_t end = tagEnd(at);
    tag(text_.substr(at, end - at), 0);
    if (!rest.starts_with("</")) ++elements_;
    return end;
  }

  // One tag's effect on the depth, which may not fall below |floor|.
  void tag(std::string_view tag, std::size_t floor) {
    bool closing = tag.starts_with("</");
    std::string_view name = tag.substr(closing ? 2 : 1);
    name = name.substr(0, name.find_first_of(" \t\r\n/>"));
    if (name != "array" && name != "dict") return;
    if (closing) {
      depth_ = depth_ > floor ? depth_ - 1 : floor;
    } else if (!tag.ends_with("/>") && !tag.ends_with("/")) {
      deepest_ = std::max(deepest_, ++depth_);
    }
  }

  void region(std::string_view inside) {
    std::size_t floor = depth_;
    for (std::size_t at = inside.find('<'); at != std::string_view::npos;
         at = inside.find('<', at + 1)) {
      tag(inside.substr(at, inside.find('>', at) - at), floor);
    }
  }

  // One past the '>' that ends the tag at |at|, skipping quoted attribute values.
  std::size_t tagEnd(std::size_t at) const {
    char quote = 0;
    for (std::size_t i = at + 1; i < text_.size(); ++i) {
      char c = text_[i];
      if (quote) {
        if (c == quote) quote = 0;
      } else if (c == '"' || c == '\'') {
        quote = c;
      } else if (c == '>') {
        return i + 1;
      }
    }
    return text_.size();
  }

  std::string_view text_;
  std::size_t maxDepth_;
  std::size_t depth_ = 0;
  std::size_t deepest_ = 0;
  std::size_t elements_ = 0;
};

}  // namespace

os::Status PlistGuard::check(std::span<const std::uint8_t> bytes, std::size_t maxDepth,
                             std::size_t maxNodes) {
  const char* data = reinterpret_cast<const char*>(bytes.data());
  if (plist_is_binary(data, static_cast<std::uint32_t>(bytes.size()))) {
    return checkBinary(bytes, maxDepth, maxNodes);
  }
  return checkXml(std::string_view(data, bytes.size()), maxDepth, maxNodes);
}

os::Status PlistGuard::checkBinary(std::span<const std::uint8_t> bytes, std::size_t maxDepth,
                                   std::size_t maxNodes) {
  auto plist = locate(bytes);
  if (!plist) return invalid("binary property list has a malformed trailer");
  if (plist->count > maxNodes) {
    return invalid(os::format("binary property list holds more than %u objects", {maxNodes}));
  }
  enum State : std::uint8_t { kNew, kOpen, kDone };
  std::vector<State> state(plist->count, kNew);
  std::vector<std::uint64_t> nodes(plist->count, 1);
  std::vector<std::size_t> depth(plist->count, 0);
  std::vector<Visit> stack;
  std::vector<bool> keys(plist->count, false);
  // Measures object |index| when it is a leaf, or opens it; fails when it cannot be read.
  auto enter = [&](std::uint64_t index) -> os::Status {
    auto object = plist->object(index);
    if (!object) return invalid("binary property list has an object out of range");
    if (!plist->keysValid(*object, keys)) {
      return invalid("binary property list has a key that is not a string or holds NUL");
    }
    state[index] = object->container ? kOpen : kDone;
    if (object->container) stack.push_back(Visit{index, *object});
    return os::success();
  };
  // Adds measured object |index| to the innermost open container.
  auto fold = [&](std::uint64_t index) {
    Visit& parent = stack.back();
    parent.nodes = std::min<std::uint64_t>(parent.nodes + nodes[index], maxNodes + 1);
    parent.depth = std::max(parent.depth, depth[index]);
  };
  if (os::Status top = enter(plist->top); !top.ok()) return top;
  while (!stack.empty()) {
    if (stack.size() > maxDepth) {
      return invalid(os::format("property list nests deeper than %u", {maxDepth}));
    }
    Visit visit = stack.back();
    if (visit.next == visit.object.refs) {
      nodes[visit.index] = visit.nodes;
      depth[visit.index] = visit.depth + 1;
      state[visit.index] = kDone;
      stack.pop_back();
      if (!stack.empty()) fold(visit.index);
      continue;
    }
    std::uint64_t child = plist->reference(visit.object, stack.back().next++);
    if (child >= plist->count) return invalid("binary property list refers past its objects");
    if (state[child] == kOpen) return invalid("binary property list contains a reference cycle");
    if (state[child] == kNew) {
      if (os::Status entered = enter(child); !entered.ok()) return entered;
    }
    if (state[child] == kDone) fold(child);
  }
  if (nodes[plist->top] > maxNodes) {
    return invalid(os::format("property list expands to more than %u values", {maxNodes}));
  }
  return os::success();
}

os::Status PlistGuard::checkXml(std::string_view text, std::size_t maxDepth, std::size_t maxNodes) {
  XmlScan scan(text, maxDepth);
  scan.run();
  if (scan.deepest() > maxDepth) {
    return invalid(os::format("property list nests deeper than %u", {maxDepth}));
  }
  if (scan.elements() > maxNodes) {
    return invalid(os::format("property list holds more than %u values", {maxNodes}));
  }
  return os::success();
}

}  // namespace value
