// The parsed command line.
#pragma once

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace vesk {

/// How the tool identifies itself to the daemon, for all commands that use it.
struct ClientIdentity {
  std::string root;
  std::string socket;
  std::int32_t clientType = 0;
  std::uint16_t clientVersion = 1;
  std::uint32_t sessionID = 0;
  std::string clientName;
  std::string serviceName;
  std::vector<std::string> userInfo;  ///< other key=text and key:=json pairs
  bool requireUserInfo = false;
  bool batch = false;
  std::chrono::milliseconds timeout{30'000};
};

struct MessageArguments {
  std::optional<std::uint16_t> category;
  std::optional<std::uint16_t> type;
  std::uint32_t flag = 0;
  std::vector<std::string> payload;  ///< key=text and key:=json pairs
  bool fromStandardInput = false;
  bool noWait = false;
};

struct UploadArguments {
  std::string path;
  std::vector<std::string> logData;  ///< one text each
  bool fromStandardInput = false;    ///< one JSON value a line
};

struct PowerLogArguments {
  std::string since;  ///< a time, or an age such as "90m"; empty: from the beginning
};

struct StorebagArguments {
  std::string directory = ".";  ///< of a new key pair
  std::string privateKey;
  std::string publicKey;
  std::string source;  ///< source or signed document, depending on the command
  std::string output;
  bool lenient = false;
};

enum class Command {
  States,
  DisplayURL,
  Send,
  SendOnce,
  Flush,
  UploadFile,
  UploadLog,
  Aggregate,
  PowerLog,
  StorebagKeygen,
  StorebagSign,
  StorebagVerify,
  StorebagShow
};

struct Invocation {
  Command command = Command::States;
  bool json = false;
  ClientIdentity identity;
  MessageArguments message;
  UploadArguments upload;
  PowerLogArguments powerLog;
  StorebagArguments storebag;
  std::uint64_t aggregateCount = 0;  ///< messages to wait for; 0: unlimited
};

}  // namespace vesk
