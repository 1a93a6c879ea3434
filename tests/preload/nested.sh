# Children of children, as a shell has them.
for word in one two three; do
    echo "$(echo "($(echo "<$word>"))" | cat)"
done
