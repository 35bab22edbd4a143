// The texts of the result codes: what a record's ResultString says when the application sent no
// message of its own, and what the module's ToString gives.
#pragma once

namespace ZarvoSDKClientCPP {

char const* ResultText(int code);

}  // namespace ZarvoSDKClientCPP
