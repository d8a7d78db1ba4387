"""Source analysis for the editor: logical lines, symbol info and the scope body cache."""
