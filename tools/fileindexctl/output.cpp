#include "output.h"

#include <fileindex/error.h>
#include <json/writer.h>

#include <cstdio>
#include <iostream>

namespace fi = WEZO::FILEINDEX;

namespace fileindexctl {

namespace {

// The length of the valid UTF-8 sequence at `text[i]`, or 0 when the byte there starts none
// (overlong forms, surrogates and code points past U+10FFFF are not valid).
size_t Utf8Length(const std::string& text, size_t i, unsigned* codePoint) {
  const auto byte = [&](size_t at) { return static_cast<unsigned char>(text[at]); };
  const unsigned lead = byte(i);
  size_t length = 0;
  unsigned value = 0;
  unsigned minimum = 0;
  if (lead < 0x80) {
    *codePoint = lead;
    return 1;
  }
  if (lead >= 0xC2 && lead <= 0xDF) {
    length = 2, value = lead & 0x1FU, minimum = 0x80;
  } else if (lead >= 0xE0 && lead <= 0xEF) {
    length = 3, value = lead & 0x0FU, minimum = 0x800;
  } else if (lead >= 0xF0 && lead <= 0xF4) {
    length = 4, value = lead & 0x07U, minimum = 0x10000;
  } else {
    return 0;
  }
  if (i + length > text.size()) {
    return 0;
  }
  for (size_t k = 1; k < length; ++k) {
    if ((byte(i + k) & 0xC0U) != 0x80) {
      return 0;
    }
    value = (value << 6U) | (byte(i + k) & 0x3FU);
  }
  if (value < minimum || value > 0x10FFFF || (value >= 0xD800 && value <= 0xDFFF)) {
    return 0;
  }
  *codePoint = value;
  return length;
}

std::string ValidUtf8(const std::string& text) {
  std::string valid;
  valid.reserve(text.size());
  for (size_t i = 0; i < text.size();) {
    unsigned codePoint = 0;
    const size_t length = Utf8Length(text, i, &codePoint);
    if (length == 0) {
      valid += "\xEF\xBF\xBD";
      ++i;
    } else {
      valid.append(text, i, length);
      i += length;
    }
  }
  return valid;
}

std::string Hex(unsigned char byte) {
  char text[5];
  (void)std::snprintf(text, sizeof text, "\\x%02x", byte);
  return text;
}

}  // namespace

std::string Printable(const std::string& text) {
  std::string shown;
  shown.reserve(text.size());
  for (size_t i = 0; i < text.size();) {
    unsigned codePoint = 0;
    const size_t length = Utf8Length(text, i, &codePoint);
    if (length == 0) {
      shown += Hex(static_cast<unsigned char>(text[i]));
      ++i;
      continue;
    }
    switch (codePoint) {
      case '\n':
        shown += "\\n";
        break;
      case '\t':
        shown += "\\t";
        break;
      case '\r':
        shown += "\\r";
        break;
      case '\\':
        shown += "\\\\";
        break;
      default:
        // C1 controls (U+0080 to U+009F) steer some terminals as ESC sequences do.
        if (codePoint < 0x20 || codePoint == 0x7F) {
          shown += Hex(static_cast<unsigned char>(codePoint));
        } else if (codePoint >= 0x80 && codePoint <= 0x9F) {
          shown += "\\u00" + Hex(static_cast<unsigned char>(codePoint)).substr(2);
        } else {
          shown.append(text, i, length);
        }
    }
    i += length;
  }
  return shown;
}

Json::Value ValidUtf8(const Json::Value& value) {
  if (value.isString()) {
    return ValidUtf8(value.asString());
  }
  if (value.isArray()) {
    Json::Value array(Json::arrayValue);
    for (const Json::Value& element : value) {
      array.append(ValidUtf8(element));
    }
    return array;
  }
  if (value.isObject()) {
    Json::Value object(Json::objectValue);
    for (auto it = value.begin(); it != value.end(); ++it) {
      object[ValidUtf8(it.name())] = ValidUtf8(*it);
    }
    return object;
  }
  return value;
}

void PrintJson(const Json::Value& value) {
  Json::StreamWriterBuilder builder;
  builder["indentation"] = "  ";
  builder["emitUTF8"] = true;
  std::cout << Json::writeString(builder, ValidUtf8(value)) << '\n';
}

Json::Value StringArray(const std::vector<std::string>& items) {
  Json::Value array(Json::arrayValue);
  for (const std::string& item : items) {
    array.append(item);
  }
  return array;
}

namespace {

Json::Value ChangesJson(const std::vector<Change>& changes) {
  Json::Value array(Json::arrayValue);
  for (const Change& change : changes) {
    Json::Value entry = change.extra;
    entry["action"] = change.action;
    entry["target"] = change.target;
    array.append(entry);
  }
  return array;
}

}  // namespace

void Output::Warn(const std::string& key, const std::string& subject, const std::string& message) {
  std::cerr << "fileindexctl: warning: " << message << '\n';
  Json::Value warning(Json::objectValue);
  warning["warning"] = key;
  warning["subject"] = subject;
  warning["message"] = message;
  m_warnings.append(warning);
}

bool Output::RefusedByStrict(const std::string& command) const {
  if (!m_strict || m_warnings.empty()) {
    return false;
  }
  const std::string reason =
      "not run: --strict and " + std::to_string(m_warnings.size()) + " warning(s)";
  std::cerr << "fileindexctl: " << command << ": " << reason << '\n';
  if (m_json) {
    Json::Value result(Json::objectValue);
    result["changes"] = Json::Value(Json::arrayValue);
    result["warnings"] = m_warnings;
    result["error"]["code"] = fi::FILEINDEX_ERR_NONE;
    result["error"]["description"] = reason;
    PrintJson(result);
  }
  return true;
}

int Output::Done(const std::vector<Change>& changes) const {
  if (m_json) {
    Json::Value result(Json::objectValue);
    result["changes"] = ChangesJson(changes);
    result["warnings"] = m_warnings;
    PrintJson(result);
    return 0;
  }
  for (const Change& change : changes) {
    std::cout << change.text << '\n';
  }
  return 0;
}

int Output::Fail(const std::string& what, const std::string& detail,
                 const Aftermath* aftermath) const {
  const int code = fi::ErrorHandler::GetError();
  std::string description = detail;
  if (code != fi::FILEINDEX_ERR_NONE) {
    description = fi::ErrorHandler::Describe(code);
  } else if (description.empty()) {
    // Without a known step, the library's last line is still the best account of the failure.
    std::string line;
    if (aftermath != nullptr) {
      line = !aftermath->failedLine.empty() ? aftermath->failedLine
             : !aftermath->logLines.empty() ? aftermath->logLines.back()
                                            : "";
    }
    description = line.empty() ? "no code recorded; -v shows the library's log"
                               : "no code recorded; the library logged: " + line;
  }
  std::cerr << "fileindexctl: " << Printable(what) << " failed: error " << code << " ("
            << Printable(description) << ")\n";
  if (aftermath != nullptr) {
    for (const Change& change : aftermath->saved) {
      std::cerr << "fileindexctl: saved all the same: " << change.text << '\n';
    }
    if (!aftermath->failedStep.empty()) {
      std::cerr << "fileindexctl: the step that failed: " << Printable(aftermath->failedStep)
                << '\n';
    }
    for (const std::string& step : aftermath->notDone) {
      std::cerr << "fileindexctl: not done: " << Printable(step) << '\n';
    }
    for (const std::string& line : aftermath->state) {
      std::cerr << "fileindexctl: " << Printable(line) << '\n';
    }
    if (!aftermath->retry.empty()) {
      std::cerr << "fileindexctl: to finish: " << Printable(aftermath->retry) << '\n';
    }
  }
  if (m_json) {
    Json::Value result(Json::objectValue);
    result["changes"] =
        ChangesJson(aftermath != nullptr ? aftermath->saved : std::vector<Change>());
    result["warnings"] = m_warnings;
    Json::Value& error = result["error"];
    error["code"] = code;
    error["description"] = description;
    if (aftermath != nullptr) {
      error["step"] = aftermath->failedStep;
      error["not_done"] = StringArray(aftermath->notDone);
      error["log"] = StringArray(aftermath->logLines);
    }
    PrintJson(result);
  }
  return kExitFailed;
}

}  // namespace fileindexctl
