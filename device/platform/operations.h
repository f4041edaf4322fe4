// Tracing the platform's operations and making them fail, in every process of the device.
//
// Each body behind platform/ runs inside an Operation, which writes a trace line and lets a fault
// rule answer in the body's place. Calls are counted per request: a worker goes on counting where
// the request process stood when it forked, so that rules hit the same call in every run.
#pragma once

#include <json/json.h>

#include <cstdint>
#include <cstdlib>
#include <exception>
#include <stdexcept>
#include <string>
#include <type_traits>
#include <vector>

#include "device/base/json_text.h"

namespace Device {

// Opens the trace file for appending; every later operation of this process and of those forked
// from it adds one line of JSON. Throws std::runtime_error.
void OpenTrace(const std::string& path);

// Adds a rule CALL[#N]=RESULT[:CODE]. The Nth call, or every call, answers RESULT instead of doing
// its work and leaves CODE as the library's last error. RESULT is a number, a text, `null`,
// `throw`, `throw-int`, which is no std::exception, or `crash`, by which the process is killed; or
// an object {"result": RESULT, NAME: VALUE...} that also fills the operation's outputs of those
// names. A text where a number is returned counts as 0; an operation that returns a pointer other
// than a text answers null. Throws std::invalid_argument for a rule that is none or names no
// operation.
void AddFault(const std::string& rule);

// The names of all operations, as rules and trace lines have them.
std::vector<std::string> OperationNames();

// Ends tracing and forgets the rules.
void StopTracing();

struct Fault {
  std::string call;
  std::uint64_t number = 0;  // 0: every call
  std::string result;
  Json::Value outputs;  // by name; null: none
  bool has_code = false;
  int code = 0;
};

// What trace lines show of an argument or a result.
Json::Value ToJson(const char* text);
Json::Value ToJson(const std::vector<std::string>& texts);
Json::Value ToJson(char* const* argument_vector);
inline Json::Value ToJson(std::nullptr_t) { return {}; }
template <typename T>
Json::Value ToJson(const T& number_or_text) {
  return number_or_text;
}
// Objects are told apart from null, no more.
template <typename T>
Json::Value ToJson(T* object) {
  return object == nullptr ? Json::Value() : Json::Value("object");
}

// The result of a fault rule as a type that an operation returns.
template <typename T>
T FromFault(const Fault& fault) {
  if constexpr (std::is_same_v<T, std::string>) {
    return fault.result;
  } else if constexpr (std::is_same_v<T, const char*>) {
    return fault.result == "null" ? nullptr : fault.result.c_str();
  } else if constexpr (std::is_pointer_v<T>) {
    return nullptr;
  } else if constexpr (std::is_same_v<T, bool>) {
    return fault.result != "0" && fault.result != "false" && fault.result != "null";
  } else if constexpr (std::is_same_v<T, Json::Value>) {
    try {
      return ParseJson(fault.result);
    } catch (const std::runtime_error&) {
      return fault.result;  // a plain text
    }
  } else {
    return static_cast<T>(std::strtoll(fault.result.c_str(), nullptr, 0));
  }
}

class Operation {
 public:
  // `name` is the operation's name in platform/, with its class.
  template <typename... Args>
  explicit Operation(const char* name, const Args&... arguments) : name_(name) {
    if (IsTracedOrFaulty()) {
      fault_ = CountAndMatch(name);
      (arguments_.append(ToJson(arguments)), ...);
    }
  }

  // Names an output, which is filled when the fault rule has a value for it. Before Run.
  template <typename T>
  Operation& Output(const char* name, T& output) {
    if (fault_ != nullptr && fault_->outputs.isMember(name)) {
      output = fault_->outputs[name].template as<T>();
    }
    return *this;
  }

  // Answers with the fault rule's result, or with the body's. Exceptions are traced and pass on.
  template <typename Body>
  auto Run(Body body) -> decltype(body()) {
    using Result = decltype(body());
    if (!IsTracedOrFaulty()) {
      return body();
    }
    if (fault_ != nullptr) {
      ApplyFault();
    }
    try {
      if constexpr (std::is_void_v<Result>) {
        if (fault_ == nullptr) {
          body();
        }
        Trace(Json::Value());
      } else {
        Result result = fault_ != nullptr ? FromFault<Result>(*fault_) : body();
        Trace(ToJson(result));
        return result;
      }
    } catch (const std::exception& error) {
      Trace(Json::Value(std::string("throws: ") + error.what()));
      throw;
    } catch (...) {
      Trace(Json::Value("throws"));
      throw;
    }
  }

 private:
  static bool IsTracedOrFaulty();
  static const Fault* CountAndMatch(const char* name);
  // Leaves the rule's code, and throws when the rule says so.
  void ApplyFault();
  void Trace(const Json::Value& result) const;

  const char* name_;
  Json::Value arguments_;  // an array, null as long as it is empty
  const Fault* fault_ = nullptr;
};

}  // namespace Device
