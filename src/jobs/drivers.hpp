#pragma once
// The five job drivers. Each takes the list path (the text behind the mode prefix) and returns
// 0; failures end the job through the fatal exit (a thrown CErrorExceptionManager).
#include <string>

namespace sar::jobs {

int main_focussing_asar_im(const std::string& listPath);
int main_focussing_asar_ap(const std::string& listPath);
int main_focussing_asar_ws_v2(const std::string& listPath);
int main_focussing_asar_rs(const std::string& listPath);
int main_multilook_wss(const std::string& listPath);

/// Every job list holds at least this many arguments.
inline constexpr std::size_t kMinJobArguments = 14;
/// The list's word for "not given".
inline constexpr std::string_view kNotOK = "NotOK";

}  // namespace sar::jobs
