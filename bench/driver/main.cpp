// Compares the daemon with what SQLite needs for the same work. scripts/bench starts it in a
// private root, in the checkout.

#include "Measurements.h"
#include "MicroResults.h"
#include "Options.h"
#include "Report.h"

#include "commandline/UsageError.h"

#include <exception>
#include <fstream>
#include <iostream>

namespace {

using namespace orva::bench;

void Run(const Options& options) {
  Results results = Measure(options);
  results.micro = ReadMicroResults(options.output + "/micro.csv");
  const std::vector<Figure> figures = ComputeFigures(results);

  std::ofstream table(options.output + "/results.txt");
  WriteTable(table, figures, results);
  WriteTable(std::cout, figures, results);
  std::ofstream json(options.output + "/results.json");
  WriteJson(json, figures, results);
  std::ofstream plot(options.output + "/performance.dat");
  WritePlotData(plot, results);
}

} // namespace

int main(int argc, char** argv) {
  try {
    if (const auto options = ParseOptions({argv + 1, argv + argc})) {
      Run(*options);
    }
    return 0;
  } catch (const orva::commandline::UsageError& error) {
    std::cerr << "bench: " << error.what() << "\nTry 'bench --help'.\n";
    return 2;
  } catch (const std::exception& error) {
    std::cerr << "bench: " << error.what() << '\n';
  } catch (const std::string& error) { // the database layer's
    std::cerr << "bench: " << error << '\n';
  }
  return 1;
}
