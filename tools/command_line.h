#ifndef TOOLS_COMMAND_LINE_H_
#define TOOLS_COMMAND_LINE_H_

#include <boost/program_options.hpp>

#include <iostream>

namespace tools {

// Parses the command line into the variables of described. Returns false
// after printing the options when --help is among them; throws
// boost::program_options::error for an unknown or malformed option.
inline bool parseCommandLine(int argc, char** argv,
                             const boost::program_options::options_description& described) {
  namespace po = boost::program_options;
  po::variables_map values;
  po::store(po::parse_command_line(argc, argv, described), values);
  if (values.count("help") > 0) {
    std::cout << described << "\n";
    return false;
  }
  po::notify(values);
  return true;
}

}  // namespace tools

#endif  // TOOLS_COMMAND_LINE_H_
