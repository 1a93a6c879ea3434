// Reads orders, a line of JSON each, keeps them, and prints the customers who spent most.
var customers = {}, number = 0;
for (var line = readLine(); line !== undefined; line = readLine()) {
    var order = JSON.parse(line);
    order.sum = order.items.reduce(function (sum, item) {
        return sum + item.count * item.price;
    }, 0);
    if (!customers[order.customer]) { customers[order.customer] = {sum: 0, orders: []}; }
    customers[order.customer].sum += order.sum;
    customers[order.customer].orders.push(order);
    ++number;
}
var names = Object.keys(customers);
names.sort(function (a, b) { return customers[b].sum - customers[a].sum || (a < b ? -1 : 1); });
print(number + ' orders of ' + names.length + ' customers');
names.slice(0, 10).forEach(function (name) {
    print(name + ' ' + customers[name].sum.toFixed(2) + ' ' + customers[name].orders.length);
});
