// Bounded text helpers.
#include "qor_text.h"

#include <climits>
#include <cstdarg>
#include <cstdio>
#include <cstring>

size_t qor_copy(char *dst, size_t size, std::string_view src)
{
	if (!dst || size == 0)
		return 0;
	size_t n = src.size() < size - 1 ? src.size() : size - 1;
	if (n)
		memmove(dst, src.data(), n);
	dst[n] = '\0';
	return n;
}

size_t qor_format(char *dst, size_t size, const char *fmt, ...)
{
	if (!dst || size == 0)
		return 0;
	va_list ap;
	va_start(ap, fmt);
	int n = vsnprintf(dst, size, fmt, ap);
	va_end(ap);
	if (n < 0) {
		dst[0] = '\0';
		return 0;
	}
	return static_cast<size_t>(n) < size ? static_cast<size_t>(n) : size - 1;
}

int qor_leading_int(std::string_view text)
{
	size_t i = 0;
	while (i < text.size() && (text[i] == ' ' || (text[i] >= '\t' && text[i] <= '\r')))
		i++;
	bool negative = false;
	if (i < text.size() && (text[i] == '+' || text[i] == '-'))
		negative = text[i++] == '-';
	long long v = 0;
	for (; i < text.size() && text[i] >= '0' && text[i] <= '9'; i++) {
		if (v <= static_cast<long long>(INT_MAX) + 1)
			v = v * 10 + (text[i] - '0');
	}
	if (negative)
		v = -v;
	if (v > INT_MAX)
		return INT_MAX;
	if (v < INT_MIN)
		return INT_MIN;
	return static_cast<int>(v);
}
