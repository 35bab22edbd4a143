// The wire format shared by the library and the host.
//
// A connection carries frames: a 4-byte little-endian payload length, then the payload. The first
// byte of a payload says what it is:
//
//   'H' hello (client):  magic "ZPP1", u16 protocol version, u16 command count, text token
//   'H' hello (host):    u16 protocol version, u16 command count
//   'Q' request:         u32 request id, u16 command, the command's inputs
//   'R' reply:           u32 request id, i32 result code, text message, the command's outputs
//                        (the message: why a command was refused; on success, what a processing
//                        stage or a filter did, in one line, and empty for every other command)
//   'E' refusal (host):  text message; the host closes the connection after it
//
// Each input and output is a tagged value (see Type): numbers in little-endian binary, texts and
// arrays behind a u32 count, numeric arrays as one block of their elements. A reader checks every
// count against the bytes that remain before it allocates anything.
#pragma once

#include <bit>
#include <cstdint>
#include <cstring>
#include <stdexcept>
#include <string>
#include <string_view>
#include <vector>

#include "protocol/catalogue.h"

namespace client3::protocol {

static_assert(std::endian::native == std::endian::little, "the wire's numbers are little-endian");

inline constexpr char kMagic[4] = {'Z', 'P', 'P', '1'};
inline constexpr std::uint16_t kVersion = 1;
// The largest payload either side accepts (a 1,000,000-frame trajectory is about 25 MiB).
inline constexpr std::uint32_t kMaxFrame = 64u << 20;
inline constexpr std::size_t kHeaderSize = 4;
// A frame buffer that grew past this for one large frame is let go once that frame is done with.
inline constexpr std::size_t kKeptBuffer = 1 << 20;

// Lets go of `buffer` when one large frame grew it past kKeptBuffer.
inline void Trim(std::vector<char>& buffer) {
  if (buffer.capacity() > kKeptBuffer) std::vector<char>().swap(buffer);
}

enum Kind : char { Hello = 'H', Request = 'Q', Reply = 'R', Refusal = 'E' };

// A payload that does not decode.
struct DecodeError : std::runtime_error {
  using std::runtime_error::runtime_error;
};

// The type a C++ value travels as.
template <class T>
struct TypeOf;
template <> struct TypeOf<std::string> { static constexpr Type value = Type::String; };
template <> struct TypeOf<std::int32_t> { static constexpr Type value = Type::Int; };
template <> struct TypeOf<std::uint32_t> { static constexpr Type value = Type::UInt; };
template <> struct TypeOf<std::uint64_t> { static constexpr Type value = Type::ULong; };
template <> struct TypeOf<bool> { static constexpr Type value = Type::Bool; };
template <> struct TypeOf<float> { static constexpr Type value = Type::Float; };
template <> struct TypeOf<double> { static constexpr Type value = Type::Double; };
template <> struct TypeOf<std::vector<std::string>> { static constexpr Type value = Type::Strings; };
template <> struct TypeOf<std::vector<bool>> { static constexpr Type value = Type::Bools; };
template <> struct TypeOf<std::vector<float>> { static constexpr Type value = Type::Floats; };
template <> struct TypeOf<std::vector<double>> { static constexpr Type value = Type::Doubles; };
template <> struct TypeOf<std::vector<std::int32_t>> { static constexpr Type value = Type::Ints; };
template <> struct TypeOf<std::vector<std::uint64_t>> { static constexpr Type value = Type::ULongs; };

struct NameValue {
  std::string name;
  std::string value;
};
using NameValues = std::vector<NameValue>;
template <> struct TypeOf<NameValues> { static constexpr Type value = Type::Params; };

// The size in bytes of one element of a fixed-size type (0 for texts, arrays and pairs).
constexpr std::size_t FixedSize(Type type) {
  switch (type) {
    case Type::Int: case Type::UInt: case Type::Float: return 4;
    case Type::ULong: case Type::Double: return 8;
    case Type::Bool: return 1;
    default: return 0;
  }
}
// The element type of an array type (itself for the others).
constexpr Type ElementType(Type type) {
  switch (type) {
    case Type::Strings: return Type::String;
    case Type::Bools: return Type::Bool;
    case Type::Floats: return Type::Float;
    case Type::Doubles: return Type::Double;
    case Type::Ints: return Type::Int;
    case Type::ULongs: return Type::ULong;
    default: return type;
  }
}

// Builds one frame: the header is reserved first and filled in by Finish.
class Writer {
public:
  // Room for a small frame from the start: most requests and replies need no other allocation.
  Writer() {
    bytes_.reserve(256);
    bytes_.resize(kHeaderSize);
  }
  explicit Writer(Kind kind) : Writer() { Raw(kind); }

  void Clear(Kind kind) {
    bytes_.resize(kHeaderSize);
    Raw(kind);
  }

  template <class T>
  void Raw(T value) {
    static_assert(std::is_trivially_copyable_v<T>);
    Append(&value, sizeof value);
  }
  void Append(const void* data, std::size_t size) {
    if (size == 0) return;
    std::size_t at = bytes_.size();
    bytes_.resize(at + size);
    std::memcpy(bytes_.data() + at, data, size);
  }
  void RawText(std::string_view text) {
    Raw(static_cast<std::uint32_t>(text.size()));
    Append(text.data(), text.size());
  }

  // Tagged values.
  void Put(std::string_view text) { Tag(Type::String), RawText(text); }
  void Put(const char* text) { Put(std::string_view(text ? text : "")); }
  void Put(const std::string& text) { Put(std::string_view(text)); }
  void Put(std::int32_t v) { Tag(Type::Int), Raw(v); }
  void Put(std::uint32_t v) { Tag(Type::UInt), Raw(v); }
  void Put(std::uint64_t v) { Tag(Type::ULong), Raw(v); }
  void Put(bool v) { Tag(Type::Bool), Raw<std::uint8_t>(v); }
  void Put(float v) { Tag(Type::Float), Raw(v); }
  void Put(double v) { Tag(Type::Double), Raw(v); }
  template <class T>
    requires(std::is_arithmetic_v<T> && !std::is_same_v<T, bool>)
  void Put(const std::vector<T>& values) {
    Tag(TypeOf<std::vector<T>>::value);
    Raw(static_cast<std::uint32_t>(values.size()));
    Append(values.data(), values.size() * sizeof(T));
  }
  void Put(const std::vector<bool>& values) {
    char* out = Block(Type::Bools, values.size(), 1);
    for (bool v : values) *out++ = v;
  }
  // An array of `count` elements of `size` bytes each, left for the caller to fill in place.
  char* Block(Type type, std::size_t count, std::size_t size) {
    Tag(type);
    Raw(static_cast<std::uint32_t>(count));
    std::size_t at = bytes_.size();
    bytes_.resize(at + count * size);
    return bytes_.data() + at;
  }
  // Any list of texts: each element gives its text through `text(element)`.
  template <class List, class Get>
  void PutTexts(const List& list, Get text) {
    Tag(Type::Strings);
    Raw(static_cast<std::uint32_t>(std::size(list)));
    for (const auto& element : list) RawText(text(element));
  }
  void Put(const std::vector<std::string>& values) {
    PutTexts(values, [](const std::string& s) -> std::string_view { return s; });
  }
  template <class List, class Get>
  void PutPairs(const List& list, Get pair) {
    Tag(Type::Params);
    Raw(static_cast<std::uint32_t>(std::size(list)));
    for (const auto& element : list) {
      auto [name, value] = pair(element);
      RawText(name);
      RawText(value);
    }
  }
  void Put(const NameValues& values) {
    PutPairs(values, [](const NameValue& p) { return std::pair<std::string_view, std::string_view>(p.name, p.value); });
  }

  // Writes the length into the header; the frame is then ready to send.
  std::string_view Finish() {
    auto size = static_cast<std::uint32_t>(bytes_.size() - kHeaderSize);
    std::memcpy(bytes_.data(), &size, sizeof size);
    return {bytes_.data(), bytes_.size()};
  }
  std::size_t size() const { return bytes_.size(); }
  // Lets go of a buffer that one large frame grew; the frame is to be begun again with Clear.
  void Trim() {
    if (bytes_.capacity() > kKeptBuffer) std::vector<char>(kHeaderSize).swap(bytes_);
  }

private:
  void Tag(Type type) { Raw(static_cast<std::uint8_t>(type)); }
  std::vector<char> bytes_;
};

// Reads one payload. Every read checks what remains and throws DecodeError past the end or on a tag
// that is not the one expected.
class Reader {
public:
  Reader(const char* data, std::size_t size) : at_(data), end_(data + size) {}
  explicit Reader(std::string_view payload) : Reader(payload.data(), payload.size()) {}

  std::size_t remaining() const { return static_cast<std::size_t>(end_ - at_); }
  const char* position() const { return at_; }
  bool done() const { return at_ == end_; }

  template <class T>
  T Raw() {
    static_assert(std::is_trivially_copyable_v<T>);
    T value;
    std::memcpy(&value, Take(sizeof value), sizeof value);
    return value;
  }
  std::string_view RawText() {
    auto size = Raw<std::uint32_t>();
    return {Take(size), size};
  }

  // The tag of the next value, without taking it.
  Type Peek() const {
    if (at_ == end_) throw DecodeError("a value is missing");
    return static_cast<Type>(*at_);
  }
  void Expect(Type type) {
    if (static_cast<Type>(Raw<std::uint8_t>()) != type) throw DecodeError("a value has the wrong type");
  }

  std::string_view Text() { return Expect(Type::String), RawText(); }
  template <class T>
  T Get() {
    Expect(TypeOf<T>::value);
    if constexpr (std::is_same_v<T, bool>)
      return Raw<std::uint8_t>() != 0;
    else
      return Raw<T>();
  }
  // A numeric array, read into any vector of its element type.
  template <class T>
    requires(std::is_arithmetic_v<T> && !std::is_same_v<T, bool>)
  void Get(std::vector<T>& out) {
    Expect(TypeOf<std::vector<T>>::value);
    std::uint32_t count = Count(sizeof(T));
    const char* bytes = Take(count * sizeof(T));
    out.resize(count);
    if (count) std::memcpy(out.data(), bytes, count * sizeof(T));
  }
  void Get(std::vector<bool>& out) {
    Expect(Type::Bools);
    std::uint32_t count = Count(1);
    const char* bytes = Take(count);
    out.assign(count, false);
    for (std::uint32_t i = 0; i < count; ++i) out[i] = bytes[i] != 0;
  }
  // A text list: `add(text)` for each element.
  template <class Add>
  void GetTexts(Add add) {
    Expect(Type::Strings);
    for (std::uint32_t i = 0, n = Count(4); i < n; ++i) add(RawText());
  }
  template <class Add>
  void GetPairs(Add add) {
    Expect(Type::Params);
    for (std::uint32_t i = 0, n = Count(8); i < n; ++i) {
      std::string_view name = RawText();
      add(name, RawText());
    }
  }

  // Checks that the next value is of `type` and steps over it.
  void Skip(Type type) {
    Expect(type);
    if (std::size_t size = FixedSize(type)) {
      Take(size);
    } else if (type == Type::String) {
      RawText();
    } else if (std::size_t element = FixedSize(ElementType(type))) {
      std::uint32_t count = Count(element);
      Take(count * element);
    } else {
      std::uint32_t texts = type == Type::Params ? 2 : 1;
      for (std::uint32_t i = 0, n = Count(4 * texts); i < n * texts; ++i) RawText();
    }
  }

private:
  // A count of elements, each at least `least` bytes long, that the remaining bytes can hold.
  std::uint32_t Count(std::size_t least) {
    auto count = Raw<std::uint32_t>();
    if (count > remaining() / least) throw DecodeError("a count exceeds the frame");
    return count;
  }
  const char* Take(std::size_t size) {
    if (size > remaining()) throw DecodeError("the frame ends too early");
    const char* p = at_;
    at_ += size;
    return p;
  }
  const char* at_;
  const char* end_;
};

// Checks that a payload holds exactly the values `params` declares, in order.
inline void Validate(Reader reader, std::span<const Param> params) {
  for (const Param& p : params) reader.Skip(p.type);
  if (!reader.done()) throw DecodeError("the frame has more values than the command takes");
}

}  // namespace client3::protocol
