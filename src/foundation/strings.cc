#include <hoxcm/errors.h>

#include <cstdio>
#include <new>

char* Str_Vasprintf(std::size_t* length, const char* format, va_list args) {
  char* text = nullptr;
  const int n = ::vasprintf(&text, format, args);
  if (n < 0) throw std::bad_alloc();
  if (length != nullptr) *length = static_cast<std::size_t>(n);
  return text;
}

char* Str_Asprintf(std::size_t* length, const char* format, ...) {
  va_list args;
  va_start(args, format);
  char* text = nullptr;
  try {
    text = Str_Vasprintf(length, format, args);
  } catch (...) {
    va_end(args);
    throw;
  }
  va_end(args);
  return text;
}
