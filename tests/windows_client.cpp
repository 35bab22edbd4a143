// The client library built for Windows, run under Wine against an application: one request far
// larger than any socket buffer, so that it goes out only if the connection blocks as it sends.
// Prints the reply's code and text.
#include <cstdio>
#include <cstdlib>
#include <vector>

#include "ZarvoSDKClientCPP/ZarvoPelluxPostClient.h"

using namespace ZarvoSDKClientCPP;

int main(int argc, char** argv) {
  if (argc != 3) return 2;
  ZarvoPelluxPostClient client;
  Output_Result connected = client.Connect(argv[1], std::atoi(argv[2]));
  if (connected.Error()) {
    std::printf("%d %s\n", static_cast<int>(connected.Result), connected.ResultString.Text());
    return 1;
  }
  std::vector<double> values(1'000'000, 1.5);
  std::vector<bool> seen(values.size(), true);
  Output_Result set = client.SetTrajectory("Alice", "LANK", values, values, values, seen);
  std::printf("%d %s\n", static_cast<int>(set.Result), set.ResultString.Text());
  return 0;
}
