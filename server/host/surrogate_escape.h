#pragma once

#include <string>

/// File names are bytes; JSON texts on the web are UTF-8. A byte 0x80 to 0xFF that is no part of
/// UTF-8 travels as the lone surrogate \udc80 to \udcff, which every JSON reader takes and browsers
/// and Python give back unchanged, so that a client can name the file again.
namespace maru::server {

/// A JSON text whose strings hold any bytes, made UTF-8.
std::string EscapeBytes(std::string text);

/// The other way: a JSON text from the web with its lone surrogates \udc80 to \udcff made bytes.
std::string UnescapeBytes(const std::string& text);

}  // namespace maru::server
