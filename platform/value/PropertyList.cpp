#include "platform/value/PropertyList.h"

#include <fcntl.h>
#include <plist/plist.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cmath>
#include <cstdlib>
#include <memory>

#include "platform/os/Format.h"
#include "platform/value/PlistGuard.h"

namespace value {

namespace {

// Seconds from 1970-01-01 to 2001-01-01, the epoch of property-list dates.
constexpr double kEpochOffset = 978307200;

struct PlistFree {
  void operator()(plist_t node) const { plist_free(node); }
};
using Node = std::unique_ptr<void, PlistFree>;

os::Error invalid(std::string message) {
  return os::Error{EINVAL, std::move(message)};
}

os::Result<Value> fromNode(plist_t node);

os::Result<Value> fromArray(plist_t node) {
  Array elements;
  elements.reserve(plist_array_get_size(node));
  plist_array_iter iter = nullptr;
  plist_array_new_iter(node, &iter);
  os::Result<Value> failure = Value();
  for (plist_t item = nullptr; plist_array_next_item(node, iter, &item), item;) {
    auto element = fromNode(item);
    if (!element.ok()) {
      failure = std::move(element);
      break;
    }
    elements.push_back(std::move(element).value());
  }
  std::free(iter);
  return failure.ok() ? Value::array(std::move(elements)) : failure;
}

os::Result<Value> fromDict(plist_t node) {
  std::map<std::string, Value> entries;
  plist_dict_iter iter = nullptr;
  plist_dict_new_iter(node, &iter);
  os::Result<Value> failure = Value();
  char* key = nullptr;
  for (plist_t item = nullptr; plist_dict_next_item(node, iter, &key, &item), item;) {
    auto element = fromNode(item);
    std::string name = key ? key : "";
    std::free(std::exchange(key, nullptr));
    if (!element.ok()) {
      failure = std::move(element);
      break;
    }
    entries.emplace(std::move(name), std::move(element).value());
  }
  std::free(key);
  std::free(iter);
  return failure.ok() ? Value::dictionary(Dictionary(std::move(entries))) : failure;
}

os::Result<Value> fromDate(plist_t node) {
  std::int32_t seconds = 0, micros = 0;
  plist_get_date_val(node, &seconds, &micros);
  // libplist reports a date it cannot fit in 32-bit seconds as INT32_MIN.
  if (seconds == INT32_MIN) return invalid("property list holds a date outside 1933...2069");
  // The seconds come truncated toward zero and the fraction without its sign.
  double since2001 = seconds < 0 ? seconds - micros / 1e6 : seconds + micros / 1e6;
  return Value::date({since2001 + kEpochOffset});
}

os::Result<Value> fromNode(plist_t node) {
  switch (plist_get_node_type(node)) {
    case PLIST_BOOLEAN: {
      std::uint8_t b = 0;
      plist_get_bool_val(node, &b);
      return Value::boolean(b != 0);
    }
    case PLIST_UINT: {
      std::uint64_t u = 0;
      plist_get_uint_val(node, &u);
      return Value::integer(static_cast<std::int64_t>(u));
    }
    case PLIST_REAL: {
      double d = 0;
      plist_get_real_val(node, &d);
      return Value::real(d);
    }
    case PLIST_STRING: {
      std::uint64_t length = 0;
      const char* s = plist_get_string_ptr(node, &length);
      return Value::string(std::string(s, length));
    }
    case PLIST_DATA: {
      std::uint64_t length = 0;
      auto* bytes = reinterpret_cast<const std::uint8_t*>(plist_get_data_ptr(node, &length));
      return Value::data(Data(bytes, bytes + length));
    }
    case PLIST_DATE:
      return fromDate(node);
    case PLIST_ARRAY:
      return fromArray(node);
    case PLIST_DICT:
      return fromDict(node);
    default:
      return invalid("property list holds a UID or another value without a counterpart");
  }
}

os::Result<Node> toNode(const Value& value, std::size_t depth);

os::Result<Node> toDate(Date date) {
  double since2001 = date.seconds - kEpochOffset;
  if (!(since2001 > INT32_MIN + 1.0 && since2001 < INT32_MAX)) {
    return invalid(os::format("date %@ is outside 1933...2069", {Value::date(date).description()}));
  }
  long long micros = std::llround(since2001 * 1e6);
  return Node(plist_new_date(static_cast<std::int32_t>(micros / 1000000),
                             static_cast<std::int32_t>(micros % 1000000)));
}

os::Result<Node> toString(const std::string& s) {
  if (s.find('\0') != std::string::npos) return invalid("property-list text cannot hold NUL");
  return Node(plist_new_string(s.c_str()));
}

os::Result<Node> toContainer(const Value& value, std::size_t depth) {
  if (depth >= PropertyList::kMaxDepth) {
    return invalid(os::format("value nests deeper than %u", {PropertyList::kMaxDepth}));
  }
  if (const Array* array = value.asArray()) {
    Node node(plist_new_array());
    for (const Value& element : *array) {
      auto child = toNode(element, depth + 1);
      if (!child.ok()) return child;
      plist_array_append_item(node.get(), child.value().release());
    }
    return node;
  }
  Node node(plist_new_dict());
  for (const auto& [key, element] : *value.asDictionary()) {
    if (key.find('\0') != std::string::npos) return invalid("property-list key cannot hold NUL");
    auto child = toNode(element, depth + 1);
    if (!child.ok()) return child;
    plist_dict_set_item(node.get(), key.c_str(), child.value().release());
  }
  return node;
}

os::Result<Node> toNode(const Value& value, std::size_t depth) {
  switch (value.type()) {
    case Type::Bool:
      return Node(plist_new_bool(*value.asBool()));
    case Type::Int:
      return Node(plist_new_uint(static_cast<std::uint64_t>(*value.asInt())));
    case Type::UInt:
      if (*value.asUInt() > INT64_MAX) break;
      return Node(plist_new_uint(*value.asUInt()));
    case Type::Real:
      return Node(plist_new_real(*value.asReal()));
    case Type::String:
      return toString(*value.asString());
    case Type::Data:
      return Node(plist_new_data(reinterpret_cast<const char*>(value.asData()->data()),
                                 value.asData()->size()));
    case Type::Date:
      return toDate(*value.asDate());
    case Type::Array:
    case Type::Dictionary:
      return toContainer(value, depth);
    default:
      break;
  }
  return invalid(os::format("a property list cannot hold %@", {value.description()}));
}

// The whole file at |path|, refusing more than |limit| bytes and anything but a regular file: a
// FIFO or a device put where a property list belongs would otherwise stall the reader for good
// (it is opened without blocking, so that the check itself cannot).
os::Result<std::vector<std::uint8_t>> slurp(const std::string& path, std::size_t limit) {
  int fd = ::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK);
  if (fd < 0) return os::Error::fromErrno("open " + path);
  struct stat status {};
  if (::fstat(fd, &status) != 0 || !S_ISREG(status.st_mode)) {
    ::close(fd);
    int errnum = S_ISDIR(status.st_mode) ? EISDIR : EINVAL;
    return os::Error{errnum, path + " is not a regular file"};
  }
  std::vector<std::uint8_t> bytes(std::min<std::size_t>(limit + 1, 64u << 10));
  std::size_t used = 0;
  for (;;) {
    if (used == bytes.size()) bytes.resize(std::min(bytes.size() * 2, limit + 1));
    ssize_t n = ::read(fd, bytes.data() + used, bytes.size() - used);
    if (n < 0 && errno == EINTR) continue;
    if (n < 0) {
      os::Error error = os::Error::fromErrno("read " + path);
      ::close(fd);
      return error;
    }
    used += static_cast<std::size_t>(n);
    if (n == 0 || used > limit) break;
  }
  ::close(fd);
  bytes.resize(used);
  return bytes;
}

}  // namespace

os::Result<Value> PropertyList::read(std::span<const std::uint8_t> bytes) {
  if (bytes.size() > kMaxBytes) {
    return os::Error{EFBIG, os::format("property list is longer than %u bytes", {kMaxBytes})};
  }
  os::Status bounded = PlistGuard::check(bytes, kMaxDepth, kMaxValues);
  if (!bounded.ok()) return bounded.error();
  plist_t root = nullptr;
  plist_from_memory(reinterpret_cast<const char*>(bytes.data()),
                    static_cast<std::uint32_t>(bytes.size()), &root);
  if (!root) return invalid("not a well-formed property list");
  Node owned(root);
  return fromNode(root);
}

os::Result<Value> PropertyList::readFile(const std::string& path) {
  auto bytes = slurp(path, kMaxBytes);
  if (!bytes.ok()) return bytes.error();
  auto value = read(bytes.value());
  if (!value.ok()) return os::Error{value.error().errnum, path + ": " + value.error().message};
  return value;
}

os::Result<std::string> PropertyList::toXml(const Value& value) {
  auto root = toNode(value, 0);
  if (!root.ok()) return root.error();
  char* xml = nullptr;
  std::uint32_t length = 0;
  plist_to_xml(root.value().get(), &xml, &length);
  if (!xml) return invalid("libplist could not write the value as XML");
  std::string text(xml, length);
  plist_to_xml_free(xml);
  return text;
}

}  // namespace value
