// The client library's client classes. ZarvoPelluxPostClient is the facade of the post-processing
// application; it derives from the library's general client.
#pragma once

#include "ZarvoSDKClientCPP/Outputs.h"
#include "ZarvoSDKClientCPP/SafeString.h"

namespace ZarvoSDKClientCPP {

class ZarvoClient {
public:
  ZarvoClient() = default;
  ZarvoClient(ZarvoClient const&) = delete;
  ZarvoClient& operator=(ZarvoClient const&) = delete;

protected:
  ~ZarvoClient() = default;
};

class ZarvoPelluxPostClient : public ZarvoClient {
public:
  ZarvoPelluxPostClient();
  ~ZarvoPelluxPostClient();
};

}  // namespace ZarvoSDKClientCPP
