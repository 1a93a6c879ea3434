# Indexes the words of the standard input, and prints those that are on most lines.
words = {}
number = 0
$stdin.each_line do |line|
  number += 1
  break if number == 40000  # An interpreter takes its time.
  line.split.each { |word| (words[word] ||= []) << number }
end
puts "#{number} lines, #{words.size} words"
words.sort_by { |word, lines| [-lines.size, word] }.first(10).each do |word, lines|
  puts "#{word} #{lines.size} #{lines.last}"
end
