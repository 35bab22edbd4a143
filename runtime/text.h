// Texts made at compile time: function names and argument messages are built from the pieces of a
// table line, so none is typed out twice and none is formatted at run time.
#pragma once

#include <cstddef>

namespace client3 {

template <std::size_t N>
struct Text {
  char chars[N]{};

  constexpr Text() = default;
  constexpr Text(const char (&s)[N]) {
    for (std::size_t i = 0; i < N; ++i) chars[i] = s[i];
  }
  static constexpr std::size_t length = N - 1;
  constexpr const char* c_str() const { return chars; }
};

namespace detail {
template <class T>
struct text_len;
template <std::size_t N>
struct text_len<Text<N>> {
  static constexpr std::size_t value = N - 1;
};
template <std::size_t N>
struct text_len<char[N]> {
  static constexpr std::size_t value = N - 1;
};
template <class T>
constexpr const char* text_chars(const T& t) {
  if constexpr (requires { t.chars; })
    return t.chars;
  else
    return t;
}
}  // namespace detail

// The concatenation of texts and string literals.
template <class... T>
constexpr auto cat(const T&... parts) {
  Text<(detail::text_len<T>::value + ... + 0) + 1> out;
  std::size_t k = 0;
  auto add = [&](const char* s, std::size_t n) {
    for (std::size_t i = 0; i < n; ++i) out.chars[k++] = s[i];
  };
  (add(detail::text_chars(parts), detail::text_len<T>::value), ...);
  out.chars[k] = 0;
  return out;
}

// A non-negative number in decimal.
template <unsigned V>
constexpr auto decimal() {
  constexpr std::size_t digits = [] {
    std::size_t n = 1;
    for (unsigned v = V; v >= 10; v /= 10) ++n;
    return n;
  }();
  Text<digits + 1> out;
  unsigned v = V;
  for (std::size_t i = digits; i-- > 0; v /= 10) out.chars[i] = char('0' + v % 10);
  return out;
}

// The qualified C++ spelling of a wrapped class, as the messages name it; the module's list of types
// gives them.
template <class T>
inline constexpr auto NameOf = Text{"?"};

// The characters of a text, with static storage.
template <Text T>
inline constexpr const char* chars = T.chars;

}  // namespace client3
