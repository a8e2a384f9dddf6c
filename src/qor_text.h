// Bounded text helpers: copy, format and cut into fixed buffers, never overrunning, always terminated.
#pragma once
#include <cstddef>
#include <string_view>

template <size_t N> constexpr size_t qor_array_size(char (&)[N])
{
	return N;
}

// Copies at most size-1 characters of src; returns the length stored.
size_t qor_copy(char *dst, size_t size, std::string_view src);

// snprintf that reports the length actually stored (cut at size-1), never a would-be length.
size_t qor_format(char *dst, size_t size, const char *fmt, ...) __attribute__((format(printf, 3, 4)));

// The buffer must be an array, so its size cannot be taken from a pointer by mistake.
#define QOR_COPY(buf, src) qor_copy(buf, qor_array_size(buf), src)
#define QOR_FORMAT(buf, ...) qor_format(buf, qor_array_size(buf), __VA_ARGS__)

// Leading-integer conversion: blanks, optional sign, digits; stops at the first other character.
// 0 when there is no digit; clamped to the int range instead of overflowing.
int qor_leading_int(std::string_view text);
