// The client library's text type and its string factory.
//
// A SafeString either owns a text duplicated through a string factory (so that text made on one side
// of the library boundary is released on the same side) or is a plain view of characters it does not
// own. All members are inline: every module that uses the type compiles them in.
#pragma once

#include <string>

namespace ZarvoSDKClientCPP {

class IStringFactory {
public:
  virtual char* Duplicate(char const* text) = 0;
  virtual void Release(char* text) = 0;

protected:
  ~IStringFactory() = default;
};

// The library's concrete factory: duplicates on the heap and releases what it duplicated.
class VStringFactory final : public IStringFactory {
public:
  char* Duplicate(char const* text) override;
  void Release(char* text) override;

  // The factory that the library's own strings use.
  static VStringFactory& Instance();
};

class SafeString {
public:
  SafeString() : OwnedText(nullptr), ViewText(nullptr), Factory(nullptr) {}
  SafeString(char const* text) : OwnedText(nullptr), ViewText(text), Factory(nullptr) {}
  SafeString(std::string const& text) : OwnedText(nullptr), ViewText(text.c_str()), Factory(nullptr) {}

  // An owning string: the text is duplicated through the factory.
  SafeString(IStringFactory& factory, char const* text)
      : OwnedText(factory.Duplicate(text)), ViewText(nullptr), Factory(&factory) {}

  SafeString(SafeString const& other)
      : OwnedText(other.Factory ? other.Factory->Duplicate(other.OwnedText) : nullptr),
        ViewText(other.ViewText),
        Factory(other.Factory) {}

  SafeString& operator=(SafeString const& other) {
    if (this != &other) {
      if (Factory) Factory->Release(OwnedText);
      ViewText = other.ViewText;
      Factory = other.Factory;
      OwnedText = Factory ? Factory->Duplicate(other.OwnedText) : nullptr;
    }
    return *this;
  }

  ~SafeString() {
    if (Factory) Factory->Release(OwnedText);
  }

  // The text: the owned copy when there is a factory, the view otherwise; null means empty.
  char const* Text() const { return Factory ? OwnedText : ViewText; }

  operator std::string() const {
    char const* text = Text();
    return text ? std::string(text) : std::string();
  }

  char* OwnedText;
  char const* ViewText;
  IStringFactory* Factory;
};

}  // namespace ZarvoSDKClientCPP
