// The plain-text description of a command that Output_GetCommandInfo carries.
#include <algorithm>
#include <cstring>
#include <string>
#include <string_view>
#include <vector>

#include "ZarvoSDKClientCPP/Outputs.h"

namespace ZarvoSDKClientCPP {

namespace {

// The text of a SafeString up to its first NUL; a null text is empty.
std::string_view View(SafeString const& text) {
  char const* chars = text.Text();
  return chars ? std::string_view(chars) : std::string_view();
}

// One line per parameter, its name padded with blanks to `width` and then its value; "None" when
// there are none.
void Describe(std::string& out, std::vector<Type_Parameter> const& parameters, std::size_t width) {
  if (parameters.empty()) {
    out += "None\n";
    return;
  }
  for (std::size_t i = 0; i < parameters.size(); ++i) {
    Type_Parameter const& parameter = parameters.at(i);
    std::string_view name = View(parameter.Name);
    out += name;
    out.append(width - name.size(), ' ');
    out += View(parameter.Value);
    out += '\n';
  }
}

}  // namespace

std::string Output_GetCommandInfo::DefaultOutputString() {
  std::string out;
  out += View(Name);
  out += '\n';
  out += View(Description);
  out += '\n';

  // Values line up in one column for both lists: three blanks past the longest name.
  std::size_t width = 0;
  for (auto const* parameters : {&InputParameters, &OutputParameters})
    for (std::size_t i = 0; i < parameters->size(); ++i) width = std::max(width, View(parameters->at(i).Name).size());
  width += 3;

  out += "----------------\nInput Parameters\n----------------\n";
  Describe(out, InputParameters, width);
  out += "-----------------\nOutput Parameters\n-----------------\n";
  Describe(out, OutputParameters, width);
  return out;
}

}  // namespace ZarvoSDKClientCPP
