-- wrk: the paths in the file that the environment names as PATHS, in turn.
local paths = {}
for line in io.lines(os.getenv("PATHS")) do
  paths[#paths + 1] = line
end
local i = 0
request = function()
  i = i % #paths + 1
  return wrk.format("GET", paths[i])
end
