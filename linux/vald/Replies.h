#pragma once

#include <tuple>
#include <utility>

#include "base/UniqueFunction.h"
#include "platform/foundation/NSError.h"

namespace skein::vald {

// Answers with an error, which is every reply's last argument, and nothing before it.
template <class... Values>
void answerError(Reply<Values...>& reply, NSErrorPtr error) {
  std::tuple<Values...> values;
  std::get<sizeof...(Values) - 1>(values) = std::move(error);
  std::apply([&reply](Values&... value) { reply(std::move(value)...); }, values);
}

}  // namespace skein::vald
