#include "Feeds.h"

#include <nlohmann/json.hpp>

#include <algorithm>
#include <sstream>
#include <stdexcept>

namespace orva::test {

namespace {

/// The records of a CSV or JSON text, without their line feeds. Only CSV has line feeds in texts.
std::vector<std::string> Records(const std::string& text) {
  const bool isJson = text.starts_with('{');
  std::vector<std::string> records;
  std::string record;
  bool isQuoted = false;
  for (const char byte : text) {
    isQuoted = isQuoted != (byte == '"' && !isJson);
    if (byte == '\n' && !isQuoted) {
      records.push_back(std::exchange(record, {}));
    } else {
      record += byte;
    }
  }
  if (!record.empty()) {
    records.push_back(record + "(no line feed)");
  }
  return records;
}

std::vector<std::string> Fields(const std::string& record) {
  std::vector<std::string> fields;
  std::istringstream stream(record + ",");
  for (std::string field; std::getline(stream, field, ',');) {
    fields.push_back(field);
  }
  return fields;
}

} // namespace

ParsedFeed::ParsedFeed(const std::string& output) {
  const bool isJson = output.starts_with('{');
  std::vector<std::string> records = Records(output);
  if (records.empty()) {
    return;
  }
  if (isJson) {
    const auto first = nlohmann::json::parse(records.front());
    id = first.at("feed");
    number = first.at("number");
    isWhole = first.at("whole");
    previous = first.at("previous").is_null() ? "" : first.at("previous");
    const auto last = nlohmann::json::parse(records.back(), nullptr, false);
    if (last.is_object() && last.contains("end")) {
      isComplete = last.at("end") == id && last.at("number") == number &&
                   last.at("rows") == records.size() - 2;
      photos = last.at("photos");
    }
  } else {
    const auto first = Fields(records.front());
    if (first.size() != 6 || first[0] != "feed") {
      throw std::runtime_error("not a feed: " + records.front());
    }
    number = std::stoull(first[1]);
    id = first[2];
    previous = first[3];
    isWhole = first[4] == "whole";
    if (records.size() > 1 && records[1] != "sign,path,volume,modified,created") {
      return;
    }
    const std::string end = "end," + first[1] + "," + id + ",";
    if (records.back().starts_with(end)) {
      const auto last = Fields(records.back());
      isComplete = last.size() == 5 && last[3] == std::to_string(records.size() - 3) &&
                   output.ends_with('\n');
      photos = isComplete ? std::stoull(last[4]) : 0;
    }
  }
  if (!isComplete) {
    return;
  }
  for (std::size_t i = isJson ? 1 : 2; i + 1 < records.size(); ++i) {
    const std::string& record = records[i];
    const std::string begin = isJson ? R"({"sign":)" : "";
    const std::size_t comma = record.find(',');
    if (!record.starts_with(begin) || comma == std::string::npos) {
      throw std::runtime_error("not a row: " + record);
    }
    rows.push_back({.sign = std::stoi(record.substr(begin.size())),
                    .text = (isJson ? "{" : "") + record.substr(comma + 1)});
  }
}

FeedReader::Result FeedReader::Take(const std::string& output) {
  const ParsedFeed feed(output);
  if (!feed.isComplete) {
    return Result::Incomplete;
  }
  if (feed.id == last_) {
    return Result::Repeated;
  }
  if (!feed.isWhole && feed.previous != last_) {
    return Result::Missed;
  }
  if (feed.isWhole) {
    photos_.clear();
  }
  for (const ParsedFeed::Row& row : feed.rows) {
    if (row.sign == 1) {
      photos_.insert(row.text);
    } else {
      const auto photo = photos_.find(row.text);
      if (row.sign != -1 || photo == photos_.end()) {
        throw std::runtime_error("cannot remove " + row.text);
      }
      photos_.erase(photo);
    }
  }
  if (photos_.size() != feed.photos) {
    throw std::runtime_error("the feed says " + std::to_string(feed.photos) + " photos");
  }
  last_ = feed.id;
  return Result::Applied;
}

std::multiset<std::string> PhotosOfExport(const std::string& output) {
  std::vector<std::string> records = Records(output);
  if (!output.starts_with('{') && !records.empty()) {
    records.erase(records.begin()); // the headings
  }
  return {records.begin(), records.end()};
}

} // namespace orva::test
