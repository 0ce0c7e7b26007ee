// Readable accounts of the alert module's configuration for people: what a
// configuration document the module posted holds, and which servers and
// profiles of a notify.xml the module left out when it read the file (it
// skips faulty ones without a word).
//
// Pure functions; any thread.
#ifndef ALERTMOD_HOST_CLI_CONFIG_REPORT_H_
#define ALERTMOD_HOST_CLI_CONFIG_REPORT_H_

#include <string>
#include <vector>

namespace refhost::cli {

// Lines describing the posted configuration `posted`: limits, web server,
// each SMTP server and each profile. Passwords are never shown. Empty when
// `posted` holds no "Notify" element.
std::vector<std::string> DescribeConfiguration(const std::string& posted);

// Lines naming the SMTP servers and profiles of the file text `file` that
// are missing from the posted configuration `posted`; empty when none are.
std::vector<std::string> DroppedEntries(const std::string& file, const std::string& posted);

}  // namespace refhost::cli

#endif  // ALERTMOD_HOST_CLI_CONFIG_REPORT_H_
