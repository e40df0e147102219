// Renders one parsed conversion with its argument into a message.
//
// Thread safety: pure functions; safe from any thread.
#pragma once

#include "platform/log/Format.h"
#include "platform/log/internal/Argument.h"
#include "platform/log/internal/BoundedText.h"
#include "platform/log/internal/Conversion.h"

namespace platform::log::internal {

// Appends the text for `conversion` applied to `argument`, or a marker when
// the argument does not fit the conversion.
// REQUIRES: conversion.status == ConversionStatus::Ok.
void writeConversion(const Conversion& conversion, const Argument& argument, Redaction redaction,
                     BoundedText& out);

// Appends "<%c?reason>"; an unprintable conversion byte shows as '?'.
void writeMarker(char conversion, std::string_view reason, BoundedText& out);

}  // namespace platform::log::internal
