#pragma once
// A small streaming JSON writer for the kelvane commands' --json output. It
// places the commas and the indentation; strings are escaped so that any
// bytes make valid JSON: quotes, backslashes and control characters are
// escaped, and bytes that are not UTF-8 become U+FFFD.
// Containers opened with `inline_container` set stay on one line (a frame of
// `packets`), others put each member on its own line.

#include <cstdint>
#include <cstdio>
#include <string>
#include <string_view>
#include <vector>

class JsonWriter {
 public:
  explicit JsonWriter(FILE* out) : out_(out) {}

  void BeginObject(bool inline_container = false) { Open('{', inline_container); }
  void EndObject() { Close('}'); }
  void BeginArray(bool inline_container = false) { Open('[', inline_container); }
  void EndArray() { Close(']'); }

  // Inside an object: the member's name; the next value or container is its value.
  void Key(std::string_view key);

  void String(std::string_view text);
  void Int(int64_t value);
  void Uint(uint64_t value);
  void Double(double value);  // null when not finite: JSON has no NaN or infinity
  void Bool(bool value);
  void Null();

  // A member in one call.
  template <typename T>
  void Field(std::string_view key, const T& value) {
    Key(key);
    Value(value);
  }
  void FieldOrNull(std::string_view key, const char* text) {
    Key(key);
    text ? String(text) : Null();
  }

  // Ends the document with a newline.
  void Finish() { std::fputc('\n', out_); }

 private:
  struct Level {
    bool inline_container;
    bool empty = true;
  };
  void Value(std::string_view v) { String(v); }
  void Value(const char* v) { String(v); }
  void Value(const std::string& v) { String(v); }
  void Value(bool v) { Bool(v); }
  void Value(double v) { Double(v); }
  void Value(int v) { Int(v); }
  void Value(long v) { Int(v); }
  void Value(long long v) { Int(v); }
  void Value(unsigned v) { Uint(v); }
  void Value(unsigned long v) { Uint(v); }
  void Value(unsigned long long v) { Uint(v); }

  void Open(char bracket, bool inline_container);
  void Close(char bracket);
  void BeforeValue();  // the comma and line break that separate it from the one before
  void NewLine();

  FILE* out_;
  std::vector<Level> levels_;
  bool after_key_ = false;
};

// `text` as the bytes of a JSON string literal, quotes included.
std::string JsonQuote(std::string_view text);
